#include "preview.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstddef>
#include <cstring>
#include <stdexcept>

#include <stb_image_write.h>

#include "gl/gl_api.h"
#include "headless_gl/headless_gl.h"
#include "output_files.h"
#include "preview_raster.h"
#include "preview_scene.h"

namespace tessik::bind {

namespace {

static_assert(sizeof(Vec3f) == 3 * sizeof(float), "positions are handed to GL as packed floats");
static_assert(sizeof(std::array<std::uint32_t, 3>) == 3 * sizeof(GLuint), "triangles go to GL as packed");

// The framebuffer-object entry points: the GL 3.0 / ARB ones share their enums and signatures with
// EXT_framebuffer_object's, so either set fills the same table.
struct FramebufferApi {
  PFNGLGENFRAMEBUFFERSPROC genFramebuffers = nullptr;
  PFNGLDELETEFRAMEBUFFERSPROC deleteFramebuffers = nullptr;
  PFNGLBINDFRAMEBUFFERPROC bindFramebuffer = nullptr;
  PFNGLGENRENDERBUFFERSPROC genRenderbuffers = nullptr;
  PFNGLDELETERENDERBUFFERSPROC deleteRenderbuffers = nullptr;
  PFNGLBINDRENDERBUFFERPROC bindRenderbuffer = nullptr;
  PFNGLRENDERBUFFERSTORAGEPROC renderbufferStorage = nullptr;
  PFNGLFRAMEBUFFERRENDERBUFFERPROC framebufferRenderbuffer = nullptr;
  PFNGLCHECKFRAMEBUFFERSTATUSPROC checkFramebufferStatus = nullptr;
  bool separateReadBinding = false;  // only the GL 3.0 / ARB flavour has a read framebuffer of its own

  bool loaded() const {
    return genFramebuffers && deleteFramebuffers && bindFramebuffer && genRenderbuffers &&
           deleteRenderbuffers && bindRenderbuffer && renderbufferStorage && framebufferRenderbuffer &&
           checkFramebufferStatus;
  }
};

FramebufferApi findFramebufferApi() {
  FramebufferApi api;
  if (support::glVersionAtLeast(3, 0) || TessikSDK::GL::hasExtension("GL_ARB_framebuffer_object")) {
    api = {glGenFramebuffers,        glDeleteFramebuffers,
           glBindFramebuffer,        glGenRenderbuffers,
           glDeleteRenderbuffers,    glBindRenderbuffer,
           glRenderbufferStorage,    glFramebufferRenderbuffer,
           glCheckFramebufferStatus, true};
    if (api.loaded()) return api;
  }
  if (TessikSDK::GL::hasExtension("GL_EXT_framebuffer_object")) {
    api = {glGenFramebuffersEXT,        glDeleteFramebuffersEXT,
           glBindFramebufferEXT,        glGenRenderbuffersEXT,
           glDeleteRenderbuffersEXT,    glBindRenderbufferEXT,
           glRenderbufferStorageEXT,    glFramebufferRenderbufferEXT,
           glCheckFramebufferStatusEXT, false};
    if (api.loaded()) return api;
  }
  throw std::runtime_error(
      "the preview needs OpenGL framebuffer objects, which the current context does not offer");
}

// Puts back everything the preview changes, in reverse order, whether rendering finishes or throws.
class SavedGLState {
 public:
  explicit SavedGLState(const FramebufferApi& api) : api_(api) {
    // Client arrays are read only with no vertex array object and no buffers bound; the element-array
    // binding belongs to the vertex array object, so it is read after switching to the default one.
    hasVertexArrays_ =
        support::glVersionAtLeast(3, 0) || TessikSDK::GL::hasExtension("GL_ARB_vertex_array_object");
    if (hasVertexArrays_) {
      glGetIntegerv(GL_VERTEX_ARRAY_BINDING, &vertexArray_);
      glBindVertexArray(0);
    }
    glGetIntegerv(GL_ELEMENT_ARRAY_BUFFER_BINDING, &elementBuffer_);
    glGetIntegerv(GL_ARRAY_BUFFER_BINDING, &arrayBuffer_);
    glGetIntegerv(GL_PIXEL_PACK_BUFFER_BINDING, &packBuffer_);
    glGetIntegerv(GL_CURRENT_PROGRAM, &program_);
    glGetIntegerv(GL_FRAMEBUFFER_BINDING, &drawFramebuffer_);
    if (api.separateReadBinding) glGetIntegerv(GL_READ_FRAMEBUFFER_BINDING, &readFramebuffer_);
    glGetIntegerv(GL_RENDERBUFFER_BINDING, &renderbuffer_);
    glPushAttrib(GL_ALL_ATTRIB_BITS);
    glPushClientAttrib(GL_CLIENT_ALL_ATTRIB_BITS);
    glMatrixMode(GL_PROJECTION);
    glPushMatrix();
    glMatrixMode(GL_MODELVIEW);
    glPushMatrix();
    glBindBuffer(GL_ELEMENT_ARRAY_BUFFER, 0);
    glBindBuffer(GL_ARRAY_BUFFER, 0);
    glBindBuffer(GL_PIXEL_PACK_BUFFER, 0);
    glUseProgram(0);
  }
  SavedGLState(const SavedGLState&) = delete;
  SavedGLState& operator=(const SavedGLState&) = delete;

  ~SavedGLState() {
    glMatrixMode(GL_PROJECTION);
    glPopMatrix();
    glMatrixMode(GL_MODELVIEW);
    glPopMatrix();
    glPopClientAttrib();
    glPopAttrib();
    glUseProgram(static_cast<GLuint>(program_));
    glBindBuffer(GL_PIXEL_PACK_BUFFER, static_cast<GLuint>(packBuffer_));
    glBindBuffer(GL_ARRAY_BUFFER, static_cast<GLuint>(arrayBuffer_));
    glBindBuffer(GL_ELEMENT_ARRAY_BUFFER, static_cast<GLuint>(elementBuffer_));
    api_.bindRenderbuffer(GL_RENDERBUFFER, static_cast<GLuint>(renderbuffer_));
    if (api_.separateReadBinding) {
      api_.bindFramebuffer(GL_DRAW_FRAMEBUFFER, static_cast<GLuint>(drawFramebuffer_));
      api_.bindFramebuffer(GL_READ_FRAMEBUFFER, static_cast<GLuint>(readFramebuffer_));
    } else {
      api_.bindFramebuffer(GL_FRAMEBUFFER, static_cast<GLuint>(drawFramebuffer_));
    }
    if (hasVertexArrays_) glBindVertexArray(static_cast<GLuint>(vertexArray_));
  }

 private:
  const FramebufferApi& api_;
  bool hasVertexArrays_ = false;
  GLint vertexArray_ = 0, elementBuffer_ = 0, arrayBuffer_ = 0, packBuffer_ = 0, program_ = 0;
  GLint drawFramebuffer_ = 0, readFramebuffer_ = 0, renderbuffer_ = 0;
};

// A colour and a depth renderbuffer attached to a framebuffer object, bound while this lives.
class OffscreenTarget {
 public:
  OffscreenTarget(const FramebufferApi& api, int width, int height) : api_(api) {
    api.genFramebuffers(1, &framebuffer_);
    api.genRenderbuffers(2, renderbuffers_);
    api.bindRenderbuffer(GL_RENDERBUFFER, renderbuffers_[0]);
    api.renderbufferStorage(GL_RENDERBUFFER, GL_RGBA8, width, height);
    api.bindRenderbuffer(GL_RENDERBUFFER, renderbuffers_[1]);
    api.renderbufferStorage(GL_RENDERBUFFER, GL_DEPTH_COMPONENT24, width, height);
    api.bindFramebuffer(GL_FRAMEBUFFER, framebuffer_);
    api.framebufferRenderbuffer(GL_FRAMEBUFFER, GL_COLOR_ATTACHMENT0, GL_RENDERBUFFER, renderbuffers_[0]);
    api.framebufferRenderbuffer(GL_FRAMEBUFFER, GL_DEPTH_ATTACHMENT, GL_RENDERBUFFER, renderbuffers_[1]);
  }
  OffscreenTarget(const OffscreenTarget&) = delete;
  OffscreenTarget& operator=(const OffscreenTarget&) = delete;

  ~OffscreenTarget() {
    // Deleting a bound framebuffer unbinds it; SavedGLState then rebinds the caller's.
    api_.deleteFramebuffers(1, &framebuffer_);
    api_.deleteRenderbuffers(2, renderbuffers_);
  }

  bool complete() const { return api_.checkFramebufferStatus(GL_FRAMEBUFFER) == GL_FRAMEBUFFER_COMPLETE; }

 private:
  const FramebufferApi& api_;
  GLuint framebuffer_ = 0;
  GLuint renderbuffers_[2] = {0, 0};
};

void drawMesh(const SurfaceMesh& mesh, const std::vector<Vec3f>& colours) {
  if (mesh.triangles.empty()) return;
  glEnable(GL_DEPTH_TEST);
  glDepthFunc(GL_LESS);
  glEnableClientState(GL_VERTEX_ARRAY);
  glEnableClientState(GL_COLOR_ARRAY);
  glVertexPointer(3, GL_FLOAT, 0, mesh.positions.data());
  glColorPointer(3, GL_FLOAT, 0, colours.data());
  glDrawElements(GL_TRIANGLES, static_cast<GLsizei>(3 * mesh.triangles.size()), GL_UNSIGNED_INT,
                 mesh.triangles.data());
  glDisableClientState(GL_COLOR_ARRAY);
  glDisableClientState(GL_VERTEX_ARRAY);
}

// The skeleton's triangles lie in the plane midway through the mesh's depth; with the depth test off they
// paint over it in the order given.
void drawSkeleton(const std::vector<preview::FlatLayer>& layers, double z) {
  glDisable(GL_DEPTH_TEST);
  glBegin(GL_TRIANGLES);
  for (const preview::FlatLayer& layer : layers) {
    glColor3f(layer.colour[0], layer.colour[1], layer.colour[2]);
    for (const auto& corner : layer.corners) glVertex3d(corner[0], corner[1], z);
  }
  glEnd();
}

}  // namespace

std::vector<std::uint8_t> renderPreviewPixels(const SurfaceMesh& mesh,
                                              const Skeleton& skeleton,
                                              const std::vector<Mat4>& jointWorld,
                                              const VertexWeights& weights,
                                              const PreviewOptions& options) {
  const preview::Scene scene = preview::makeScene(mesh, skeleton, jointWorld, weights, options);
  if (options.device == PreviewDevice::cpu) return preview::rasterizeScene(mesh, scene);
  if (mesh.triangles.size() > static_cast<std::size_t>(INT_MAX / 3))
    throw std::invalid_argument("the mesh has too many triangles to draw in one call");
  if (support::currentGLVersionString().empty())
    throw std::runtime_error("the preview needs a current OpenGL context and there is none on this thread");
  if (!support::glVersionAtLeast(2, 1))
    throw std::runtime_error("the preview needs OpenGL 2.1 or newer, the context has " +
                             support::currentGLVersionString());
  const FramebufferApi api = findFramebufferApi();

  const int width = options.width, height = options.height;
  GLint maxRenderbuffer = 0, maxViewport[2] = {0, 0};
  glGetIntegerv(GL_MAX_RENDERBUFFER_SIZE, &maxRenderbuffer);
  glGetIntegerv(GL_MAX_VIEWPORT_DIMS, maxViewport);
  const int limit = std::min({maxRenderbuffer, maxViewport[0], maxViewport[1]});
  if (std::max(width, height) > limit)
    throw std::runtime_error("the preview size " + std::to_string(width) + "x" + std::to_string(height) +
                             " exceeds this OpenGL's framebuffer limit of " + std::to_string(limit));
  const int factor = preview::supersampleFactor(width, height, limit);
  const int bigWidth = width * factor, bigHeight = height * factor;

  const preview::Framing& framing = scene.framing;
  std::vector<std::uint8_t> big(static_cast<std::size_t>(bigWidth) * bigHeight * 4);
  {
    // Errors the caller left behind would otherwise be blamed on the preview; a lost context repeats its
    // error forever, hence the bound.
    for (int i = 0; i < 32 && glGetError() != GL_NO_ERROR; ++i) {
    }
    const SavedGLState saved(api);
    const OffscreenTarget target(api, bigWidth, bigHeight);
    if (!target.complete())
      throw std::runtime_error("the preview's " + std::to_string(bigWidth) + "x" + std::to_string(bigHeight) +
                               " off-screen framebuffer cannot be made");
    glViewport(0, 0, bigWidth, bigHeight);
    for (GLenum cap : {GL_LIGHTING, GL_TEXTURE_2D, GL_BLEND, GL_CULL_FACE, GL_SCISSOR_TEST, GL_STENCIL_TEST,
                       GL_ALPHA_TEST, GL_FOG, GL_COLOR_LOGIC_OP, GL_POLYGON_OFFSET_FILL, GL_DITHER})
      glDisable(cap);
    glPolygonMode(GL_FRONT_AND_BACK, GL_FILL);
    glShadeModel(GL_SMOOTH);
    glColorMask(GL_TRUE, GL_TRUE, GL_TRUE, GL_TRUE);
    glDepthMask(GL_TRUE);
    glClearColor(preview::kBackground[0], preview::kBackground[1], preview::kBackground[2], 1.0f);
    glClearDepth(1.0);
    glClear(GL_COLOR_BUFFER_BIT | GL_DEPTH_BUFFER_BIT);
    glMatrixMode(GL_PROJECTION);
    glLoadIdentity();
    glOrtho(framing.left, framing.right, framing.bottom, framing.top, framing.zNear, framing.zFar);
    glMatrixMode(GL_MODELVIEW);
    glLoadIdentity();

    drawMesh(mesh, scene.vertexColours);
    drawSkeleton(scene.skeleton, framing.midZ);

    glPixelStorei(GL_PACK_ALIGNMENT, 1);
    glPixelStorei(GL_PACK_ROW_LENGTH, 0);
    glPixelStorei(GL_PACK_SKIP_ROWS, 0);
    glPixelStorei(GL_PACK_SKIP_PIXELS, 0);
    glReadBuffer(GL_COLOR_ATTACHMENT0);
    glReadPixels(0, 0, bigWidth, bigHeight, GL_RGBA, GL_UNSIGNED_BYTE, big.data());
    const GLenum error = glGetError();
    if (error != GL_NO_ERROR)
      throw std::runtime_error("OpenGL reported error " + std::to_string(error) +
                               " while drawing the preview");
  }
  return preview::downsampleFlipped(big, width, height, factor);
}

void renderPreview(const std::string& pngPath,
                   const SurfaceMesh& mesh,
                   const Skeleton& skeleton,
                   const std::vector<Mat4>& jointWorld,
                   const VertexWeights& weights,
                   const PreviewOptions& options) {
  const std::vector<std::uint8_t> rgba = renderPreviewPixels(mesh, skeleton, jointWorld, weights, options);
  std::vector<std::uint8_t> rgb(rgba.size() / 4 * 3);
  for (std::size_t i = 0; i < rgba.size() / 4; ++i) std::memcpy(&rgb[3 * i], &rgba[4 * i], 3);
  // Encoded in memory and written here: stb reports success whatever the writes did.
  std::vector<unsigned char> png;
  auto append = [](void* context, void* data, int size) {
    auto* out = static_cast<std::vector<unsigned char>*>(context);
    const auto* bytes = static_cast<const unsigned char*>(data);
    out->insert(out->end(), bytes, bytes + size);
  };
  if (stbi_write_png_to_func(append, &png, options.width, options.height, 3, rgb.data(), options.width * 3) ==
      0)
    throw std::runtime_error("cannot encode the preview PNG '" + pngPath + "'");
  writeFileChecked(pngPath, png.data(), png.size());
}

}  // namespace tessik::bind
