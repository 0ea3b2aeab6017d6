#pragma once

#include <optional>
#include <string>

// An off-screen desktop OpenGL context for tests and tools, made through EGL so that no window system
// (X11, Wayland) is needed. Not part of libtessik.
namespace tessik::support {

struct GLVersion {
  int major = 0;
  int minor = 0;
};

// Reads the leading "major.minor" of a GL_VERSION string. Implementations may put "OpenGL ES " before
// it and vendor text after it. Empty when the text holds no version.
std::optional<GLVersion> parseGLVersion(const char* text);

// Whether `version` is `major`.`minor` or newer.
bool versionAtLeast(const GLVersion& version, int major, int minor);

// GL_VERSION of the context current on this thread; empty when no context is current.
std::string currentGLVersionString();

// Whether the context current on this thread reports at least `major`.`minor`; false when no context is
// current or its version cannot be read.
bool glVersionAtLeast(int major, int minor);

// Owns an EGL display connection and a desktop-GL (compatibility profile) context without any surface.
// The context is current on the creating thread when create() returns; the destructor releases it
// from the destroying thread if it is current there and destroys it.
class HeadlessGLContext {
 public:
  // Tries, in order: the Mesa surfaceless platform, the default display (what NVIDIA's EGL serves
  // without a window system), and each EGL device. On failure returns nothing and, when `error` is not
  // null, stores which step failed for each attempt and which packages provide a working driver.
  static std::optional<HeadlessGLContext> create(std::string* error);

  HeadlessGLContext(HeadlessGLContext&& other) noexcept;
  HeadlessGLContext& operator=(HeadlessGLContext&& other) noexcept;
  HeadlessGLContext(const HeadlessGLContext&) = delete;
  HeadlessGLContext& operator=(const HeadlessGLContext&) = delete;
  ~HeadlessGLContext();

  // Makes this context current on the calling thread (it must not be current on another thread).
  bool makeCurrent() const;
  bool isCurrent() const;
  // Which display path succeeded: "surfaceless", "default" or "device"; empty once moved from.
  const std::string& displayKind() const { return displayKind_; }

 private:
  // The EGL handles are kept as void* so that this header does not drag EGL's headers into users.
  HeadlessGLContext(void* display, void* context, std::string displayKind);
  void release() noexcept;

  void* display_ = nullptr;
  void* context_ = nullptr;
  std::string displayKind_;
};

// The one way hosts (tools, Python, tests, benchmarks) get a context to bind in: the context already
// current on this thread if there is one, otherwise a headless one, made current and stored in `made`
// (keep it alive while binding). The GL entry points of gl/gl_api.h are loaded either way. Answers false,
// with the reason in `error` when it is not null, when neither works.
bool ensureGLContext(std::optional<HeadlessGLContext>& made, std::string* error);

// For hosts choosing where GPU-capable work runs: ensureGLContext, but with `anyRenderer` false a
// context that renders in software is given up again (one made here is released), because the processor
// paths are far faster than Mesa's software GL. Answers whether a context is current for the caller.
// With no GL library installed it loads nothing and answers false.
bool acquireGLForGpuWork(std::optional<HeadlessGLContext>& made, bool anyRenderer, std::string* error);

}  // namespace tessik::support
