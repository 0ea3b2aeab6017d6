#pragma once

#include <vector>

#include <tessik/corvane.h>

namespace tessik::test {

using TessikSDK::Corvane::CBoneDataClass;
using TessikSDK::Corvane::CCorvane;
using TessikSDK::Corvane::CPointDataClass;

// Opens the engine's records to the tests, the way a host subclass sees them.
class InspectableCorvane : public CCorvane {
 public:
  const CBoneDataClass& bone(int i) const { return bones[i]; }
  const CPointDataClass& point(int i) const { return points[i]; }
  std::uint64_t boneCount() const { return bones.UsedLength(); }
  std::uint64_t boneReserve() const { return bones.ReservedLength(); }
  std::uint64_t pointCount() const { return points.UsedLength(); }
  const TessikSDK::Geom::Matrix3& objectTM() const { return initTM; }
};

// Per-point influence streams kept alive for the engine, which only points at them.
struct Influences {
  std::vector<int> bones;
  std::vector<float> weights;

  void attach(CCorvane& engine, int pointIndex) {
    engine.SetPointData(pointIndex, static_cast<int>(bones.size()), sizeof(int), bones.data(), sizeof(float),
                        weights.data(), 0, nullptr, 0, nullptr, 0, nullptr, 0, nullptr, 0, nullptr);
  }
};

}  // namespace tessik::test
