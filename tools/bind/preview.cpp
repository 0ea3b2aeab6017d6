#include "preview.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cmath>
#include <cstddef>
#include <cstring>
#include <stdexcept>

#include <stb_image_write.h>

#include "gl/gl_api.h"
#include "headless_gl/headless_gl.h"
#include "pose.h"

namespace tessik::bind {

namespace {

constexpr int kMinSize = 16;
constexpr int kMaxSize = 8192;
// Drawing at twice the size and averaging 2x2 blocks smooths silhouettes and the skeleton's edges without
// multisampled framebuffers, which a GL 2.1 context may lack. Past this many output pixels the
// supersampled buffer (four times as large) would cost more memory than the smoothing is worth.
constexpr int kSupersample = 2;
constexpr long long kMaxSupersampledPixels = 2048LL * 2048LL;
constexpr double kMargin = 0.1;  // of the framed half-size, on every side
constexpr float kAmbient = 0.35f;
constexpr Vec3f kBackground = {0.13f, 0.14f, 0.16f};
constexpr Vec3f kUnweighted = {0.6f, 0.6f, 0.6f};
constexpr Vec3f kBoneColour = {1.0f, 1.0f, 1.0f};
constexpr Vec3f kOutlineColour = {0.05f, 0.05f, 0.05f};
// The skeleton's marks in output pixels for an 800-pixel picture, scaled with it, but never so thin that
// the white bar blurs into its outline.
constexpr double kBoneHalfWidth = 2.0, kMinBoneHalfWidth = 1.0;
constexpr double kOutline = 1.5, kMinOutline = 1.0;
constexpr double kDotRadius = 5.0, kMinDotRadius = 2.5;
constexpr int kDotSegments = 24;

static_assert(sizeof(Vec3f) == 3 * sizeof(float), "positions are handed to GL as packed floats");
static_assert(sizeof(std::array<std::uint32_t, 3>) == 3 * sizeof(GLuint), "triangles go to GL as packed");

// Light from the upper left and in front, fixed to the camera.
Vec3f lightDirection() {
  const float x = -0.4f, y = 0.5f, z = 0.77f;
  const float length = std::sqrt(x * x + y * y + z * z);
  return {x / length, y / length, z / length};
}

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

// What the orthographic camera sees, in mesh units.
struct Framing {
  double left, right, bottom, top, zNear, zFar;
  double midZ;
  double unitsPerPixel;  // of the output picture
};

Framing frame(const SurfaceMesh& mesh, const std::vector<Mat4>& jointWorld, int width, int height) {
  std::array<double, 3> lo = {HUGE_VAL, HUGE_VAL, HUGE_VAL};
  std::array<double, 3> hi = {-HUGE_VAL, -HUGE_VAL, -HUGE_VAL};
  auto grow = [&](const Vec3f& p) {
    for (int k = 0; k < 3; ++k) {
      lo[k] = std::min(lo[k], static_cast<double>(p[k]));
      hi[k] = std::max(hi[k], static_cast<double>(p[k]));
    }
  };
  for (const Vec3f& p : mesh.positions) grow(p);
  for (const Mat4& m : jointWorld) grow(translationOf(m));
  if (lo[0] > hi[0]) {
    lo = {-1.0, -1.0, -1.0};
    hi = {1.0, 1.0, 1.0};
  }

  // A flat or single-point scene still needs a view of some size.
  double extent = std::max({hi[0] - lo[0], hi[1] - lo[1], hi[2] - lo[2]}) / 2.0;
  if (!(extent > 0.0)) extent = 1.0;
  const double halfX = std::max((hi[0] - lo[0]) / 2.0, 1e-3 * extent);
  const double halfY = std::max((hi[1] - lo[1]) / 2.0, 1e-3 * extent);
  const double aspect = static_cast<double>(width) / height;
  const double halfHeight = std::max(halfY, halfX / aspect) * (1.0 + kMargin);
  const double halfWidth = halfHeight * aspect;
  const double cx = (lo[0] + hi[0]) / 2.0, cy = (lo[1] + hi[1]) / 2.0;
  const double pad = 0.1 * extent;
  // The eye looks down -Z from the origin, so glOrtho's near and far are distances along -Z.
  return {cx - halfWidth, cx + halfWidth, cy - halfHeight,       cy + halfHeight,
          -(hi[2] + pad), -(lo[2] - pad), (lo[2] + hi[2]) / 2.0, 2.0 * halfHeight / height};
}

std::vector<Vec3f> shadedColours(const SurfaceMesh& mesh, const VertexWeights& weights) {
  const std::vector<Vec3f> computed =
      mesh.normals.empty() ? smoothNormals(mesh.positions, mesh.triangles) : std::vector<Vec3f>();
  const std::vector<Vec3f>& normals = mesh.normals.empty() ? computed : mesh.normals;
  const Vec3f light = lightDirection();
  std::vector<Vec3f> colours(mesh.positions.size());
  for (std::size_t v = 0; v < colours.size(); ++v) {
    Vec3f sum = {0.0f, 0.0f, 0.0f};
    float total = 0.0f;
    for (std::uint32_t i = weights.begin(v); i < weights.end(v); ++i) {
      const Influence& influence = weights.influences[i];
      const Vec3f c = jointColour(influence.bone);
      for (int k = 0; k < 3; ++k) sum[k] += influence.weight * c[k];
      total += influence.weight;
    }
    Vec3f base = kUnweighted;
    if (total > 0.0f) base = {sum[0] / total, sum[1] / total, sum[2] / total};
    const Vec3f& n = normals[v];
    // |n . l| lights both faces alike, so a surface whose normals point inward does not go black.
    const float diffuse = std::fabs(n[0] * light[0] + n[1] * light[1] + n[2] * light[2]);
    const float shade = kAmbient + (1.0f - kAmbient) * std::min(diffuse, 1.0f);
    colours[v] = {base[0] * shade, base[1] * shade, base[2] * shade};
  }
  return colours;
}

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

// Bars and dots as triangles in the view plane, sized in pixels: wide lines and large points are
// optional in GL and clamp to small limits on some drivers.
void drawSkeleton(const Skeleton& skeleton,
                  const std::vector<Mat4>& jointWorld,
                  const Framing& framing,
                  double pixelScale) {
  const double unit = framing.unitsPerPixel;
  const double halfWidth = std::max(kBoneHalfWidth * pixelScale, kMinBoneHalfWidth) * unit;
  const double outline = std::max(kOutline * pixelScale, kMinOutline) * unit;
  const double radius = std::max(kDotRadius * pixelScale, kMinDotRadius) * unit;
  const double z = framing.midZ;
  auto bars = [&](double half) {
    for (std::size_t j = 0; j < skeleton.joints.size(); ++j) {
      if (skeleton.joints[j].parent < 0) continue;
      const Vec3f a = translationOf(jointWorld[static_cast<std::size_t>(skeleton.joints[j].parent)]);
      const Vec3f b = translationOf(jointWorld[j]);
      const double dx = b[0] - a[0], dy = b[1] - a[1];
      const double length = std::hypot(dx, dy);
      if (!(length > 0.0)) continue;  // a bone along the view axis shows as its dots alone
      const double px = -dy / length * half, py = dx / length * half;
      glVertex3d(a[0] + px, a[1] + py, z);
      glVertex3d(a[0] - px, a[1] - py, z);
      glVertex3d(b[0] - px, b[1] - py, z);
      glVertex3d(a[0] + px, a[1] + py, z);
      glVertex3d(b[0] - px, b[1] - py, z);
      glVertex3d(b[0] + px, b[1] + py, z);
    }
  };
  auto dots = [&](double r) {
    constexpr double kTwoPi = 6.28318530717958647692;
    for (const Mat4& m : jointWorld) {
      const Vec3f c = translationOf(m);
      for (int s = 0; s < kDotSegments; ++s) {
        const double a0 = kTwoPi * s / kDotSegments, a1 = kTwoPi * (s + 1) / kDotSegments;
        glVertex3d(c[0], c[1], z);
        glVertex3d(c[0] + r * std::cos(a0), c[1] + r * std::sin(a0), z);
        glVertex3d(c[0] + r * std::cos(a1), c[1] + r * std::sin(a1), z);
      }
    }
  };
  glDisable(GL_DEPTH_TEST);
  glBegin(GL_TRIANGLES);
  // Every outline first, so no outline cuts across another bone's white.
  glColor3f(kOutlineColour[0], kOutlineColour[1], kOutlineColour[2]);
  bars(halfWidth + outline);
  dots(radius + outline);
  glColor3f(kBoneColour[0], kBoneColour[1], kBoneColour[2]);
  bars(halfWidth);
  dots(radius);
  glEnd();
}

void checkSize(const PreviewOptions& options) {
  for (int size : {options.width, options.height})
    if (size < kMinSize || size > kMaxSize)
      throw std::invalid_argument("the preview size " + std::to_string(options.width) + "x" +
                                  std::to_string(options.height) + " is outside " + std::to_string(kMinSize) +
                                  " to " + std::to_string(kMaxSize) + " pixels");
}

}  // namespace

Vec3f jointColour(std::uint32_t joint) {
  constexpr double kGoldenRatioConjugate = 0.61803398874989484820;
  constexpr double kSaturation = 0.7, kValue = 0.95;
  const double hue = std::fmod(joint * kGoldenRatioConjugate, 1.0) * 6.0;
  const int sector = static_cast<int>(hue) % 6;
  const double f = hue - std::floor(hue);
  const auto p = static_cast<float>(kValue * (1.0 - kSaturation));
  const auto q = static_cast<float>(kValue * (1.0 - kSaturation * f));
  const auto t = static_cast<float>(kValue * (1.0 - kSaturation * (1.0 - f)));
  const auto v = static_cast<float>(kValue);
  switch (sector) {
    case 0:
      return {v, t, p};
    case 1:
      return {q, v, p};
    case 2:
      return {p, v, t};
    case 3:
      return {p, q, v};
    case 4:
      return {t, p, v};
    default:
      return {v, p, q};
  }
}

std::vector<std::uint8_t> renderPreviewPixels(const SurfaceMesh& mesh,
                                              const Skeleton& skeleton,
                                              const std::vector<Mat4>& jointWorld,
                                              const VertexWeights& weights,
                                              const PreviewOptions& options) {
  checkSize(options);
  checkSkinInputs(mesh, skeleton, jointWorld, weights);
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
  const int factor = std::max(width, height) * kSupersample <= limit &&
                             static_cast<long long>(width) * height <= kMaxSupersampledPixels
                         ? kSupersample
                         : 1;
  const int bigWidth = width * factor, bigHeight = height * factor;

  const Framing framing = frame(mesh, jointWorld, width, height);
  const std::vector<Vec3f> colours = shadedColours(mesh, weights);
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
    glClearColor(kBackground[0], kBackground[1], kBackground[2], 1.0f);
    glClearDepth(1.0);
    glClear(GL_COLOR_BUFFER_BIT | GL_DEPTH_BUFFER_BIT);
    glMatrixMode(GL_PROJECTION);
    glLoadIdentity();
    glOrtho(framing.left, framing.right, framing.bottom, framing.top, framing.zNear, framing.zFar);
    glMatrixMode(GL_MODELVIEW);
    glLoadIdentity();

    drawMesh(mesh, colours);
    drawSkeleton(skeleton, jointWorld, framing, std::min(width, height) / 800.0);

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

  // GL's rows run bottom to top; the picture's run top to bottom.
  std::vector<std::uint8_t> pixels(static_cast<std::size_t>(width) * height * 4);
  const int samples = factor * factor;
  for (int y = 0; y < height; ++y)
    for (int x = 0; x < width; ++x)
      for (int c = 0; c < 4; ++c) {
        int sum = 0;
        for (int dy = 0; dy < factor; ++dy)
          for (int dx = 0; dx < factor; ++dx)
            sum += big[(static_cast<std::size_t>(y * factor + dy) * bigWidth + x * factor + dx) * 4 + c];
        pixels[(static_cast<std::size_t>(height - 1 - y) * width + x) * 4 + c] =
            static_cast<std::uint8_t>((sum + samples / 2) / samples);
      }
  return pixels;
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
  errno = 0;
  if (stbi_write_png(pngPath.c_str(), options.width, options.height, 3, rgb.data(), options.width * 3) == 0)
    throw std::runtime_error("cannot write the preview PNG '" + pngPath + "'" +
                             (errno != 0 ? std::string(": ") + std::strerror(errno) : std::string()));
}

}  // namespace tessik::bind
