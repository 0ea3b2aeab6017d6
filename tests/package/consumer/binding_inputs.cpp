// Includes the binding header first and alone: it must compile without any other header before it.
#include <cstdio>

#include <tessik/geombind.h>
#include <tessik/pipeline.h>

int checkBindingInputs() {
  using namespace TessikSDK::GeomBind;
  IMesh* mesh = IMesh::create();
  ITransformHierarchy* bones = ITransformHierarchy::create();
  mesh->addVertex(0, 0, 0);
  mesh->addVertex(1, 0, 0);
  mesh->addVertex(0, 1, 0);
  mesh->addTriangle(0, 1, 2);
  const double identity[16] = {1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1};
  const bool added = bones->addNode("root", identity, nullptr);
  const bool repeated = bones->addNode("root", identity, nullptr);
  ITransformHierarchy::dispose(bones);
  IMesh::dispose(mesh);
  if (!added || repeated) {
    std::fprintf(stderr, "hierarchy accepted %d/%d, expected 1/0\n", added, repeated);
    return 1;
  }
  std::printf("binding inputs created and disposed\n");

  // The pipeline's header must stand alone once installed, and its error must be catchable by type.
  try {
    TessikSDK::Pipeline::bindSkin({}, {}, TessikSDK::Pipeline::Options{});
    std::fprintf(stderr, "binding an empty mesh did not throw\n");
    return 1;
  } catch (const TessikSDK::Pipeline::BindError& e) {
    if (e.kind() != TessikSDK::Pipeline::BindError::Kind::invalidInput) return 1;
    std::printf("empty mesh refused: %s\n", e.what());
  }
  return 0;
}
