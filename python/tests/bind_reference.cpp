// Binds a mesh read from a text file through the C++ interface, the way a C++ host does, and prints the
// raw per-vertex (bone, weight) lists. The Python tests compare the module's arrays with this output, so
// any slip in how the module hands numpy data to the library (matrix layout, parent names, index order,
// padding) shows up as a difference.
//
// Input (whitespace separated):
//   method falloff influenceLimit resolution refineInterior   method: heatmap | geodesic
//   V, then V lines "x y z"
//   T, then T lines "a b c"
//   B, then B lines "name parent m0 ... m15" (parent "-" for a root; matrix row-major)
// Output: V, then one line per vertex "n bone weight bone weight ..." (weights with 17 digits).

#include <array>
#include <cstdio>
#include <fstream>
#include <iostream>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <tessik/geombind.h>

#include "headless_gl/headless_gl.h"

namespace {

using namespace TessikSDK::GeomBind;

template <typename T, typename Dispose>
std::unique_ptr<T, Dispose> owned(T* object, Dispose dispose) {
  return std::unique_ptr<T, Dispose>(object, dispose);
}

// Says nothing: the library's own console progress would mix into the output.
class Quiet : public IProgress {
 public:
  void begin(const char*, int, int) override {}
  void end() override {}
  void setRange(int, int) override {}
  bool update(int) override { return false; }
  bool isCanceled() override { return false; }
};

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::cerr << "usage: " << argv[0] << " INPUT\n";
    return 2;
  }
  std::ifstream input(argv[1]);
  std::string method;
  float falloff = 0;
  unsigned limit = 0;
  int resolution = 0;
  int refine = 0;
  std::size_t vertexCount = 0;
  if (!(input >> method >> falloff >> limit >> resolution >> refine >> vertexCount)) {
    std::cerr << "bind_reference: cannot read the header of " << argv[1] << '\n';
    return 2;
  }

  // The GL context must outlive the binding context, which owns GL objects.
  std::optional<tessik::support::HeadlessGLContext> gl;
  auto context = owned(IContext::create(), &IContext::dispose);
  if (!context) {
    std::string error;
    gl = tessik::support::HeadlessGLContext::create(&error);
    if (gl) context.reset(IContext::create());
    if (!context) {
      std::cerr << "bind_reference: no OpenGL context: " << error << '\n';
      return 3;
    }
  }

  auto mesh = owned(IMesh::create(), &IMesh::dispose);
  for (std::size_t v = 0; v < vertexCount; ++v) {
    float x, y, z;
    input >> x >> y >> z;
    mesh->addVertex(x, y, z);
  }
  std::size_t triangleCount = 0;
  input >> triangleCount;
  for (std::size_t t = 0; t < triangleCount; ++t) {
    unsigned a, b, c;
    input >> a >> b >> c;
    mesh->addTriangle(a, b, c);
  }
  std::size_t boneCount = 0;
  input >> boneCount;
  auto bones = owned(ITransformHierarchy::create(), &ITransformHierarchy::dispose);
  for (std::size_t b = 0; b < boneCount; ++b) {
    std::string name, parent;
    std::array<double, 16> m;
    input >> name >> parent;
    for (double& e : m) input >> e;
    if (!bones->addNode(name.c_str(), m.data(), parent == "-" ? nullptr : parent.c_str())) {
      std::cerr << "bind_reference: bone '" << name << "' refused\n";
      return 2;
    }
  }
  if (!input) {
    std::cerr << "bind_reference: " << argv[1] << " ended early\n";
    return 2;
  }

  Quiet quiet;
  ISparseVertexWeights* result =
      method == "heatmap" ? context->bindHeatmap(mesh.get(), bones.get(), &quiet, falloff, limit)
                          : context->bindGeodesicSparseVoxel(mesh.get(), bones.get(), &quiet, falloff, limit,
                                                             resolution, refine != 0);
  // The geodesic method reports its stage timings on stdout; the lists follow a marker line.
  std::cout << "\nweights " << result->numVertices() << '\n';
  for (unsigned v = 0; v < result->numVertices(); ++v) {
    std::cout << result->numWeights(v);
    for (unsigned k = 0; k < result->numWeights(v); ++k) {
      const BoneWeight w = result->getWeight(v, k);
      char weight[32];
      std::snprintf(weight, sizeof weight, "%.17g", w.weight);
      std::cout << ' ' << w.boneIndex << ' ' << weight;
    }
    std::cout << '\n';
  }
  return 0;
}
