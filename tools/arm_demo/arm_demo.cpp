// Bends a two-bone arm with the skin engine and writes the result as an OBJ, as a host would:
// bind-time mesh and bones in, one PreComputeBoneXFormTMs per pose, then MapPoint for every point.

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <string>
#include <vector>

#include <tessik/corvane.h>
#include <tessik/geom.h>

namespace {

using TessikSDK::Corvane::CCorvane;
using TessikSDK::Geom::Matrix3;
using TessikSDK::Geom::Point3;

constexpr float kPi = 3.14159265358979323846f;
constexpr float kLength = 2.0f;
constexpr float kRadius = 0.2f;
constexpr float kElbowX = 1.0f;
// The skin blends between the bones over this half-width around the elbow; a hard switch at x = 1
// would tear the surface open on the inside of the bend.
constexpr float kBlendHalfWidth = 0.2f;
constexpr int kRings = 161;
constexpr int kSegments = 24;
// Repeating the mapping until this much time has passed keeps the rate from being clock noise.
constexpr double kMinTimingSeconds = 0.05;

struct Options {
  std::string outPath = "arm_bent.obj";
  float angleDegrees = 90.0f;
};

struct Mesh {
  std::vector<float> positions;  // xyz per point
  std::vector<int> triangles;    // three zero-based point indices per triangle
  int tipCentre = 0;             // index of the centre of the end cap at x = kLength
};

void PrintUsage(std::ostream& os, const char* argv0) {
  os << "usage: " << argv0 << " [--out PATH | PATH] [--angle DEGREES]\n"
     << "  Bends a skinned two-bone arm at the elbow and writes the deformed mesh as an OBJ.\n"
     << "  --out PATH       where to write the OBJ (default: arm_bent.obj in the current directory)\n"
     << "  --angle DEGREES  elbow bend about +Z (default: 90)\n";
}

// Returns -1 to go on, otherwise the exit code.
int ParseArgs(int argc, char** argv, Options& options) {
  bool outGiven = false;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    auto value = [&](const char* name) -> const char* {
      if (i + 1 >= argc) {
        std::cerr << "error: " << name << " needs a value\n";
        return nullptr;
      }
      return argv[++i];
    };
    if (arg == "-h" || arg == "--help") {
      PrintUsage(std::cout, argv[0]);
      return 0;
    }
    if (arg == "--out" || arg.rfind("--out=", 0) == 0) {
      const char* v = arg == "--out" ? value("--out") : arg.c_str() + 6;
      if (v == nullptr || *v == '\0') {
        if (v != nullptr) std::cerr << "error: --out needs a non-empty path\n";
        return 2;
      }
      options.outPath = v;
      outGiven = true;
    } else if (arg == "--angle" || arg.rfind("--angle=", 0) == 0) {
      const char* v = arg == "--angle" ? value("--angle") : arg.c_str() + 8;
      if (v == nullptr) return 2;
      char* end = nullptr;
      const float degrees = std::strtof(v, &end);
      if (end == v || *end != '\0' || !std::isfinite(degrees)) {
        std::cerr << "error: --angle expects a number of degrees, got '" << v << "'\n";
        return 2;
      }
      options.angleDegrees = degrees;
    } else if (!arg.empty() && arg[0] != '-' && !outGiven) {
      options.outPath = arg;
      outGiven = true;
    } else {
      std::cerr << "error: unexpected argument '" << arg << "'\n";
      PrintUsage(std::cerr, argv[0]);
      return 2;
    }
  }
  return -1;
}

// An open-ended tube would leave the OBJ with holes at both ends, so the caps are closed with fans.
Mesh MakeArm() {
  Mesh mesh;
  for (int r = 0; r < kRings; ++r) {
    const float x = kLength * static_cast<float>(r) / static_cast<float>(kRings - 1);
    for (int s = 0; s < kSegments; ++s) {
      const float theta = 2.0f * kPi * static_cast<float>(s) / static_cast<float>(kSegments);
      mesh.positions.insert(mesh.positions.end(), {x, kRadius * std::cos(theta), kRadius * std::sin(theta)});
    }
  }
  const int startCentre = kRings * kSegments;
  mesh.tipCentre = startCentre + 1;
  mesh.positions.insert(mesh.positions.end(), {0.0f, 0.0f, 0.0f, kLength, 0.0f, 0.0f});

  auto at = [](int ring, int seg) { return ring * kSegments + (seg % kSegments); };
  // Winding is counter-clockwise seen from outside, so the normals face out.
  for (int r = 0; r + 1 < kRings; ++r) {
    for (int s = 0; s < kSegments; ++s) {
      mesh.triangles.insert(mesh.triangles.end(), {at(r, s), at(r, s + 1), at(r + 1, s)});
      mesh.triangles.insert(mesh.triangles.end(), {at(r, s + 1), at(r + 1, s + 1), at(r + 1, s)});
    }
  }
  for (int s = 0; s < kSegments; ++s) {
    mesh.triangles.insert(mesh.triangles.end(), {startCentre, at(0, s + 1), at(0, s)});
    mesh.triangles.insert(mesh.triangles.end(), {mesh.tipCentre, at(kRings - 1, s), at(kRings - 1, s + 1)});
  }
  return mesh;
}

float ForearmWeight(float x) {
  const float t = std::clamp((x - (kElbowX - kBlendHalfWidth)) / (2.0f * kBlendHalfWidth), 0.0f, 1.0f);
  return t * t * (3.0f - 2.0f * t);
}

Matrix3 Translation(const Point3& t) { return Matrix3(Point3(1, 0, 0), Point3(0, 1, 0), Point3(0, 0, 1), t); }

bool WriteObj(const std::string& path,
              const std::vector<float>& positions,
              const std::vector<int>& triangles) {
  std::ofstream file(path);
  if (!file) return false;
  file << "# tessik arm demo: two-bone arm bent at the elbow\n";
  for (std::size_t i = 0; i + 2 < positions.size(); i += 3) {
    file << "v " << positions[i] << ' ' << positions[i + 1] << ' ' << positions[i + 2] << '\n';
  }
  // OBJ indices are one-based.
  for (std::size_t i = 0; i + 2 < triangles.size(); i += 3) {
    file << "f " << triangles[i] + 1 << ' ' << triangles[i + 1] + 1 << ' ' << triangles[i + 2] + 1 << '\n';
  }
  file.close();
  return static_cast<bool>(file);
}

int Run(const Options& options) {
  const Mesh mesh = MakeArm();
  const int numPoints = static_cast<int>(mesh.positions.size() / 3);

  // Every point lists both bones, so the engine takes its blending path everywhere.
  std::vector<int> boneIDs(2 * static_cast<std::size_t>(numPoints));
  std::vector<float> weights(2 * static_cast<std::size_t>(numPoints));
  for (int i = 0; i < numPoints; ++i) {
    const float forearm = ForearmWeight(mesh.positions[3 * i]);
    boneIDs[2 * i] = 0;
    boneIDs[2 * i + 1] = 1;
    weights[2 * i] = 1.0f - forearm;
    weights[2 * i + 1] = forearm;
  }

  const float angle = options.angleDegrees * kPi / 180.0f;
  const Point3 elbow(kElbowX, 0.0f, 0.0f);
  Matrix3 bentForearm = TessikSDK::Geom::RotAngleAxisMatrix(Point3(0.0f, 0.0f, 1.0f), angle);
  bentForearm.SetRow(3, elbow);

  CCorvane engine;
  engine.SetNumBones(2);
  engine.SetNumPoints(numPoints);
  engine.SetInitTM(Matrix3());
  // Upper arm: shoulder at the origin, it stays put.
  engine.SetInitBoneTM(0, Matrix3());
  engine.SetBoneTM(0, Matrix3());
  // Forearm: its bone space starts at the elbow; posing it rotates about that joint.
  engine.SetInitBoneTM(1, Translation(elbow));
  engine.SetBoneTM(1, bentForearm);
  for (int i = 0; i < numPoints; ++i) {
    engine.SetPointData(i, 2, sizeof(int), &boneIDs[2 * i], sizeof(float), &weights[2 * i], 0, nullptr, 0,
                        nullptr, 0, nullptr, 0, nullptr, 0, nullptr);
  }
  engine.PreComputeBoneXFormTMs();

  std::vector<float> bindPose = mesh.positions;
  std::vector<float> deformed(bindPose.size());
  using Clock = std::chrono::steady_clock;
  const Clock::time_point start = Clock::now();
  long long passes = 0;
  double seconds = 0.0;
  do {
    for (int i = 0; i < numPoints; ++i) engine.MapPoint(i, &bindPose[3 * i], &deformed[3 * i]);
    ++passes;
    seconds = std::chrono::duration<double>(Clock::now() - start).count();
  } while (seconds < kMinTimingSeconds);

  Point3 lo(deformed[0], deformed[1], deformed[2]);
  Point3 hi = lo;
  for (int i = 0; i < numPoints; ++i) {
    for (int c = 0; c < 3; ++c) {
      lo[c] = std::min(lo[c], deformed[3 * i + c]);
      hi[c] = std::max(hi[c], deformed[3 * i + c]);
    }
  }
  const Point3 tip(&deformed[3 * mesh.tipCentre]);
  // The tip is weighted to the forearm alone, so it must land exactly on the rotated bind position.
  const Point3 expectedTip(kElbowX + (kLength - kElbowX) * std::cos(angle),
                           (kLength - kElbowX) * std::sin(angle), 0.0f);

  if (!WriteObj(options.outPath, deformed, mesh.triangles)) {
    std::cerr << "error: cannot write OBJ to '" << options.outPath << "': " << std::strerror(errno) << '\n';
    return 1;
  }
  std::error_code ec;
  const std::filesystem::path shown = std::filesystem::absolute(options.outPath, ec);

  const double pointsPerSecond = static_cast<double>(numPoints) * static_cast<double>(passes) / seconds;
  auto fmt = [](const Point3& p) {
    char buf[96];
    std::snprintf(buf, sizeof buf, "(%.4f, %.4f, %.4f)", p.x, p.y, p.z);
    return std::string(buf);
  };
  std::cout << "arm:               " << numPoints << " points, " << mesh.triangles.size() / 3
            << " triangles, length " << kLength << ", radius " << kRadius << '\n'
            << "bones:             upper arm x=0..1, forearm x=1..2, 2 influences per point\n"
            << "elbow bend:        " << options.angleDegrees << " degrees about +Z at " << fmt(elbow) << '\n'
            << "deformed bbox min: " << fmt(lo) << '\n'
            << "deformed bbox max: " << fmt(hi) << '\n'
            << "forearm tip:       " << fmt(tip) << "  (expected " << fmt(expectedTip) << ")\n"
            << "mapping:           " << passes << " passes in " << seconds * 1e3 << " ms, "
            << pointsPerSecond / 1e6 << " M points/s (one thread)\n"
            << "OBJ written to:    " << (ec ? std::filesystem::path(options.outPath) : shown).string()
            << '\n';

  const Point3 miss = tip - expectedTip;
  if (miss.Length() > 1e-4f) {
    std::cerr << "error: the forearm tip is " << miss.Length() << " away from where the bend puts it\n";
    return 1;
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  Options options;
  const int parsed = ParseArgs(argc, argv, options);
  if (parsed >= 0) return parsed;
  try {
    return Run(options);
  } catch (const std::exception& e) {
    std::cerr << "error: skin engine failed: " << e.what() << '\n';
    return 1;
  }
}
