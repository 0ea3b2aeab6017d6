#include <cmath>
#include <cstdio>
#include <exception>

#include <tessik/corvane.h>
#include <tessik/geom.h>
#include <tessik/util.h>

namespace {

using TessikSDK::Geom::Matrix3;
using TessikSDK::Geom::Point3;

bool near(float a, float b) { return std::fabs(a - b) <= 1e-5f; }

}  // namespace

int checkBindingInputs();

int main() {
  TessikSDK::Corvane::CCorvane engine;
  engine.SetNumBones(1);
  engine.SetNumPoints(1);
  engine.SetInitBoneTM(0, Matrix3());
  engine.SetBoneTM(0, Matrix3(Point3(1, 0, 0), Point3(0, 1, 0), Point3(0, 0, 1), Point3(10, 0, 0)));
  int bone = 0;
  float weight = 1.0f;
  engine.SetPointData(0, 1, sizeof(int), &bone, sizeof(float), &weight, 0, nullptr, 0, nullptr, 0, nullptr, 0,
                      nullptr, 0, nullptr);
  engine.PreComputeBoneXFormTMs();

  float in[3] = {1.0f, 2.0f, 3.0f};
  float out[3] = {0.0f, 0.0f, 0.0f};
  engine.MapPoint(0, in, out);
  std::printf("mapped (%g, %g, %g) to (%g, %g, %g)\n", in[0], in[1], in[2], out[0], out[1], out[2]);
  if (!near(out[0], 11.0f) || !near(out[1], 2.0f) || !near(out[2], 3.0f)) {
    std::fprintf(stderr, "expected (11, 2, 3)\n");
    return 1;
  }

  // The exception types must be exported from the shared library, or a consumer's handler cannot match
  // what the library throws.
  try {
    engine.MapPoint(1, in, out);
    std::fprintf(stderr, "mapping a point that does not exist did not throw\n");
    return 1;
  } catch (const TessikSDK::Util::OutOfRangeException&) {
    std::printf("bad point index threw OutOfRangeException\n");
  } catch (const std::exception& e) {
    std::fprintf(stderr, "bad point index threw something else: %s\n", e.what());
    return 1;
  }
  return checkBindingInputs();
}
