// Throughput of the skin engine against the loop a host would write by hand for the same blend.
//
// BM_MapPoint and BM_PlainBlendLoop run on one shared scene per (points, influences) pair and both
// count one item per mapped point, so their items_per_second columns compare directly.

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include <tessik/corvane.h>
#include <tessik/geom.h>

#include "common/run_benchmarks.h"

namespace {

using TessikSDK::Corvane::CCorvane;
using TessikSDK::Geom::Matrix3;
using TessikSDK::Geom::Point3;

constexpr int kSceneBones = 64;
constexpr std::uint32_t kSeed = 20240611;

Point3 RandomUnit(std::mt19937& rng) {
  std::uniform_real_distribution<float> d(-1.0f, 1.0f);
  for (;;) {
    const Point3 v(d(rng), d(rng), d(rng));
    if (v.Length() > 0.1f) return v.Normalize();
  }
}

// A rigid transform, as bones and objects usually carry.
Matrix3 RandomRigid(std::mt19937& rng, float maxOffset) {
  std::uniform_real_distribution<float> angle(-3.1f, 3.1f);
  std::uniform_real_distribution<float> offset(-maxOffset, maxOffset);
  Matrix3 m = TessikSDK::Geom::RotAngleAxisMatrix(RandomUnit(rng), angle(rng));
  m.SetRow(3, Point3(offset(rng), offset(rng), offset(rng)));
  return m;
}

struct BoneMatrix {
  float m[12];  // rows: X axis, Y axis, Z axis, translation
};

struct BoneSetup {
  Matrix3 initTM;
  std::vector<Matrix3> initBoneTMs;
  std::vector<Matrix3> currentTMs;
};

BoneSetup MakeBones(int numBones, std::mt19937& rng) {
  BoneSetup setup;
  setup.initTM = RandomRigid(rng, 2.0f);
  for (int b = 0; b < numBones; ++b) {
    const Matrix3 init = RandomRigid(rng, 3.0f);
    setup.initBoneTMs.push_back(init);
    // Every bone moves, so no transform is the identity that a clever path could skip.
    setup.currentTMs.push_back(init * RandomRigid(rng, 0.5f));
  }
  return setup;
}

void LoadBones(CCorvane& engine, const BoneSetup& setup) {
  const int numBones = static_cast<int>(setup.initBoneTMs.size());
  engine.SetNumBones(numBones);
  engine.SetInitTM(setup.initTM);
  for (int b = 0; b < numBones; ++b) {
    engine.SetInitBoneTM(b, setup.initBoneTMs[b]);
    engine.SetBoneTM(b, setup.currentTMs[b]);
    engine.SetBoneFlags(b, 0);
  }
}

struct Scene {
  int numPoints = 0;
  int influences = 0;
  std::vector<float> positions;  // xyz per point
  std::vector<int> boneIDs;      // `influences` per point, contiguous
  std::vector<float> weights;    // same layout as boneIDs
  std::vector<BoneMatrix> xForms;
  std::unique_ptr<CCorvane> engine;
  std::vector<float> out;
  std::string error;  // set when the engine and the plain loop disagree, which voids the comparison
};

// The blend as a host writes it without the engine: same matrices, same zero-weight skip, same
// single-influence formula and the same 1e-5 threshold, so both sides do the same arithmetic.
void PlainBlend(const Scene& s, float* out) {
  const int k = s.influences;
  const float* pos = s.positions.data();
  const int* ids = s.boneIDs.data();
  const float* ws = s.weights.data();
  const BoneMatrix* mats = s.xForms.data();
  for (int i = 0; i < s.numPoints; ++i) {
    const float px = pos[3 * i];
    const float py = pos[3 * i + 1];
    const float pz = pos[3 * i + 2];
    const int* pid = ids + static_cast<std::size_t>(i) * k;
    const float* pw = ws + static_cast<std::size_t>(i) * k;
    float* o = out + 3 * static_cast<std::size_t>(i);
    if (k == 1) {
      const float* m = mats[pid[0]].m;
      const float w = pw[0];
      const float qx = px * m[0] + py * m[3] + pz * m[6] + m[9];
      const float qy = px * m[1] + py * m[4] + pz * m[7] + m[10];
      const float qz = px * m[2] + py * m[5] + pz * m[8] + m[11];
      o[0] = px + (qx - px) * w;
      o[1] = py + (qy - py) * w;
      o[2] = pz + (qz - pz) * w;
      continue;
    }
    float ax = 0.0f;
    float ay = 0.0f;
    float az = 0.0f;
    float sum = 0.0f;
    for (int j = 0; j < k; ++j) {
      const float w = pw[j];
      if (w == 0.0f) continue;
      const float* m = mats[pid[j]].m;
      ax += w * (px * m[0] + py * m[3] + pz * m[6] + m[9]);
      ay += w * (px * m[1] + py * m[4] + pz * m[7] + m[10]);
      az += w * (px * m[2] + py * m[5] + pz * m[8] + m[11]);
      sum += w;
    }
    const bool blended = static_cast<double>(sum) > 1e-5;
    o[0] = blended ? ax : px;
    o[1] = blended ? ay : py;
    o[2] = blended ? az : pz;
  }
}

std::unique_ptr<Scene> BuildScene(int numPoints, int influences) {
  auto s = std::make_unique<Scene>();
  s->numPoints = numPoints;
  s->influences = influences;
  std::mt19937 rng(kSeed + static_cast<std::uint32_t>(numPoints) * 7u +
                   static_cast<std::uint32_t>(influences));
  const BoneSetup bones = MakeBones(kSceneBones, rng);

  const std::size_t n = static_cast<std::size_t>(numPoints);
  const std::size_t k = static_cast<std::size_t>(influences);
  std::uniform_real_distribution<float> coord(-1.0f, 1.0f);
  std::uniform_real_distribution<float> share(0.05f, 1.0f);
  std::uniform_int_distribution<int> pick(0, kSceneBones - 1);
  s->positions.resize(3 * n);
  s->boneIDs.resize(n * k);
  s->weights.resize(n * k);
  for (std::size_t i = 0; i < n; ++i) {
    for (int c = 0; c < 3; ++c) s->positions[3 * i + c] = coord(rng);
    int* ids = &s->boneIDs[i * k];
    float* ws = &s->weights[i * k];
    float total = 0.0f;
    for (std::size_t j = 0; j < k; ++j) {
      int id;
      do {
        id = pick(rng);
      } while (std::find(ids, ids + j, id) != ids + j);  // a real skin never lists a bone twice
      ids[j] = id;
      ws[j] = share(rng);
      total += ws[j];
    }
    for (std::size_t j = 0; j < k; ++j) ws[j] /= total;
  }

  s->engine = std::make_unique<CCorvane>();
  CCorvane& engine = *s->engine;
  LoadBones(engine, bones);
  engine.SetNumPoints(numPoints);
  for (int i = 0; i < numPoints; ++i) {
    const std::size_t at = static_cast<std::size_t>(i) * k;
    engine.SetPointData(i, influences, sizeof(int), &s->boneIDs[at], sizeof(float), &s->weights[at], 0,
                        nullptr, 0, nullptr, 0, nullptr, 0, nullptr, 0, nullptr);
  }
  engine.PreComputeBoneXFormTMs();

  const Matrix3 objectFromWorld = TessikSDK::Geom::Inverse(bones.initTM);
  for (int b = 0; b < kSceneBones; ++b) {
    const Matrix3 x =
        bones.initTM * TessikSDK::Geom::Inverse(bones.initBoneTMs[b]) * bones.currentTMs[b] * objectFromWorld;
    BoneMatrix bm;
    for (int r = 0; r < 4; ++r) {
      for (int c = 0; c < 3; ++c) bm.m[3 * r + c] = x.GetRow(r)[c];
    }
    s->xForms.push_back(bm);
  }

  s->out.assign(3 * n, 0.0f);
  std::vector<float> plain(3 * n, 0.0f);
  for (int i = 0; i < numPoints; ++i) engine.MapPoint(i, &s->positions[3 * i], &s->out[3 * i]);
  PlainBlend(*s, plain.data());
  for (std::size_t c = 0; c < 3 * n; ++c) {
    if (std::fabs(s->out[c] - plain[c]) > 1e-4f * (1.0f + std::fabs(plain[c]))) {
      s->error = "engine and plain loop disagree at point " + std::to_string(c / 3);
      break;
    }
  }
  return s;
}

// One scene at a time: the largest ones take a few hundred MB, and the pairs run back to back.
Scene& GetScene(int numPoints, int influences) {
  static std::unique_ptr<Scene> current;
  if (!current || current->numPoints != numPoints || current->influences != influences) {
    current.reset();
    current = BuildScene(numPoints, influences);
  }
  return *current;
}

void BM_MapPoint(benchmark::State& state) {
  Scene& s = GetScene(static_cast<int>(state.range(0)), static_cast<int>(state.range(1)));
  if (!s.error.empty()) {
    state.SkipWithError(s.error.c_str());
    return;
  }
  const CCorvane& engine = *s.engine;
  float* in = s.positions.data();
  float* out = s.out.data();
  const int n = s.numPoints;
  for (auto _ : state) {
    for (int i = 0; i < n; ++i) engine.MapPoint(i, in + 3 * i, out + 3 * i);
    benchmark::DoNotOptimize(static_cast<const float*>(out));
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * n);
}

void BM_PlainBlendLoop(benchmark::State& state) {
  const Scene& s = GetScene(static_cast<int>(state.range(0)), static_cast<int>(state.range(1)));
  if (!s.error.empty()) {
    state.SkipWithError(s.error.c_str());
    return;
  }
  std::vector<float> out(s.out.size(), 0.0f);
  float* o = out.data();
  for (auto _ : state) {
    PlainBlend(s, o);
    benchmark::DoNotOptimize(static_cast<const float*>(o));
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * s.numPoints);
}

void BM_PreComputeBoneXFormTMs(benchmark::State& state) {
  const int numBones = static_cast<int>(state.range(0));
  std::mt19937 rng(kSeed + static_cast<std::uint32_t>(numBones));
  CCorvane engine;
  LoadBones(engine, MakeBones(numBones, rng));
  for (auto _ : state) {
    engine.PreComputeBoneXFormTMs();
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * numBones);
}

void RegisterAll() {
  // Registered pairwise so each engine figure sits next to its plain-loop reference in the output.
  for (const int points : {10000, 100000, 1000000}) {
    for (const int influences : {1, 2, 4}) {
      benchmark::RegisterBenchmark("BM_MapPoint", BM_MapPoint)
          ->Args({points, influences})
          ->ArgNames({"points", "influences"})
          ->Unit(benchmark::kMicrosecond);
      benchmark::RegisterBenchmark("BM_PlainBlendLoop", BM_PlainBlendLoop)
          ->Args({points, influences})
          ->ArgNames({"points", "influences"})
          ->Unit(benchmark::kMicrosecond);
    }
  }
  // The engine spreads bones over TBB workers; CPU time of the calling thread alone would flatter it.
  benchmark::RegisterBenchmark("BM_PreComputeBoneXFormTMs", BM_PreComputeBoneXFormTMs)
      ->Arg(10)
      ->Arg(100)
      ->Arg(1000)
      ->Arg(10000)
      ->ArgName("bones")
      ->UseRealTime()
      ->Unit(benchmark::kMicrosecond);
}

}  // namespace

int main(int argc, char** argv) {
  RegisterAll();
  return tessik::bench::runBenchmarks(argc, argv);
}
