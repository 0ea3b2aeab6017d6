#include "headless_gl/headless_gl.h"

#include <cctype>
#include <map>
#include <mutex>
#include <type_traits>
#include <utility>

#include <dlfcn.h>

// The GL table's header brings GLEW's, which must come before any other GL header.
// clang-format off
#include "gl/gl_api.h"
#include <EGL/egl.h>
#include <EGL/eglext.h>
// clang-format on

namespace tessik::support {
namespace {

// EGL is opened at run time, like GL itself: a program that never asks for a context never needs it.
struct EglApi {
  decltype(&::eglGetProcAddress) GetProcAddress = nullptr;
  decltype(&::eglGetError) GetError = nullptr;
  decltype(&::eglGetDisplay) GetDisplay = nullptr;
  decltype(&::eglInitialize) Initialize = nullptr;
  decltype(&::eglTerminate) Terminate = nullptr;
  decltype(&::eglBindAPI) BindAPI = nullptr;
  decltype(&::eglQueryAPI) QueryAPI = nullptr;
  decltype(&::eglChooseConfig) ChooseConfig = nullptr;
  decltype(&::eglCreateContext) CreateContext = nullptr;
  decltype(&::eglDestroyContext) DestroyContext = nullptr;
  decltype(&::eglMakeCurrent) MakeCurrent = nullptr;
  decltype(&::eglGetCurrentContext) GetCurrentContext = nullptr;
  bool ok = false;
};

EglApi loadEgl() {
  EglApi api;
  void* library = dlopen("libEGL.so.1", RTLD_NOW | RTLD_LOCAL);  // kept open for the process's life
  if (library == nullptr) return api;
  bool all = true;
  auto get = [&](auto& entry, const char* name) {
    entry = reinterpret_cast<std::remove_reference_t<decltype(entry)>>(dlsym(library, name));
    all = all && entry != nullptr;
  };
  get(api.GetProcAddress, "eglGetProcAddress");
  get(api.GetError, "eglGetError");
  get(api.GetDisplay, "eglGetDisplay");
  get(api.Initialize, "eglInitialize");
  get(api.Terminate, "eglTerminate");
  get(api.BindAPI, "eglBindAPI");
  get(api.QueryAPI, "eglQueryAPI");
  get(api.ChooseConfig, "eglChooseConfig");
  get(api.CreateContext, "eglCreateContext");
  get(api.DestroyContext, "eglDestroyContext");
  get(api.MakeCurrent, "eglMakeCurrent");
  get(api.GetCurrentContext, "eglGetCurrentContext");
  api.ok = all;
  return api;
}

const EglApi& egl() {
  static const EglApi api = loadEgl();
  return api;
}

}  // namespace

// clang-format off
#define eglGetProcAddress (egl().GetProcAddress)
#define eglGetError (egl().GetError)
#define eglGetDisplay (egl().GetDisplay)
#define eglInitialize (egl().Initialize)
#define eglTerminate (egl().Terminate)
#define eglBindAPI (egl().BindAPI)
#define eglQueryAPI (egl().QueryAPI)
#define eglChooseConfig (egl().ChooseConfig)
#define eglCreateContext (egl().CreateContext)
#define eglDestroyContext (egl().DestroyContext)
#define eglMakeCurrent (egl().MakeCurrent)
#define eglGetCurrentContext (egl().GetCurrentContext)
// clang-format on

namespace {

constexpr const char* kInstallHint =
    "A headless OpenGL driver is needed. Debian/Ubuntu: apt-get install libegl1 libegl-mesa0 "
    "libgl1-mesa-dri (Mesa, works without a GPU). NVIDIA machines: install the NVIDIA driver's EGL "
    "library (Debian: libegl-nvidia0; Ubuntu: libnvidia-gl-<driver version>) matching the kernel "
    "driver.";

const char* eglErrorName(EGLint code) {
  switch (code) {
    case EGL_SUCCESS:
      return "EGL_SUCCESS";
    case EGL_NOT_INITIALIZED:
      return "EGL_NOT_INITIALIZED";
    case EGL_BAD_ACCESS:
      return "EGL_BAD_ACCESS";
    case EGL_BAD_ALLOC:
      return "EGL_BAD_ALLOC";
    case EGL_BAD_ATTRIBUTE:
      return "EGL_BAD_ATTRIBUTE";
    case EGL_BAD_CONFIG:
      return "EGL_BAD_CONFIG";
    case EGL_BAD_CONTEXT:
      return "EGL_BAD_CONTEXT";
    case EGL_BAD_CURRENT_SURFACE:
      return "EGL_BAD_CURRENT_SURFACE";
    case EGL_BAD_DISPLAY:
      return "EGL_BAD_DISPLAY";
    case EGL_BAD_MATCH:
      return "EGL_BAD_MATCH";
    case EGL_BAD_NATIVE_PIXMAP:
      return "EGL_BAD_NATIVE_PIXMAP";
    case EGL_BAD_NATIVE_WINDOW:
      return "EGL_BAD_NATIVE_WINDOW";
    case EGL_BAD_PARAMETER:
      return "EGL_BAD_PARAMETER";
    case EGL_BAD_SURFACE:
      return "EGL_BAD_SURFACE";
    case EGL_CONTEXT_LOST:
      return "EGL_CONTEXT_LOST";
    case EGL_BAD_DEVICE_EXT:
      return "EGL_BAD_DEVICE_EXT";
    default:
      return "unknown EGL error";
  }
}

std::string failure(const char* step) {
  const EGLint code = eglGetError();
  return std::string(step) + " failed (" + eglErrorName(code) + ")";
}

// EGL initialisation is per display, not per caller: eglTerminate would also destroy the contexts of
// every other HeadlessGLContext on the same display. Counting our own users lets each context end
// without pulling the display from under the others.
std::mutex& displayUsersMutex() {
  static std::mutex mutex;
  return mutex;
}

std::map<EGLDisplay, int>& displayUsers() {
  static std::map<EGLDisplay, int> users;
  return users;
}

void acquireDisplay(EGLDisplay display) {
  std::lock_guard<std::mutex> lock(displayUsersMutex());
  ++displayUsers()[display];
}

void releaseDisplay(EGLDisplay display) {
  std::lock_guard<std::mutex> lock(displayUsersMutex());
  auto& users = displayUsers();
  auto it = users.find(display);
  if (it == users.end()) return;
  if (--it->second == 0) {
    users.erase(it);
    eglTerminate(display);
  }
}

// eglGetCurrentContext and eglMakeCurrent act on the thread's bound client API, which starts out as
// OpenGL ES on every thread; desktop-GL calls must bind EGL_OPENGL_API first and should put the
// caller's choice back afterwards.
class ScopedOpenGLApi {
 public:
  ScopedOpenGLApi() : previous_(eglQueryAPI()) { eglBindAPI(EGL_OPENGL_API); }
  ~ScopedOpenGLApi() {
    if (previous_ != EGL_OPENGL_API && previous_ != EGL_NONE) eglBindAPI(previous_);
  }
  ScopedOpenGLApi(const ScopedOpenGLApi&) = delete;
  ScopedOpenGLApi& operator=(const ScopedOpenGLApi&) = delete;

 private:
  EGLenum previous_;
};

// Initialises `display` and makes a compatibility-profile desktop-GL context current on it with no
// surface. On success holds one display reference; on failure holds none and describes the step.
bool makeContextOn(EGLDisplay display, EGLContext* context, std::string* why) {
  if (display == EGL_NO_DISPLAY) {
    *why = failure("getting the display");
    return false;
  }
  EGLint major = 0;
  EGLint minor = 0;
  if (eglInitialize(display, &major, &minor) != EGL_TRUE) {
    *why = failure("eglInitialize");
    return false;
  }
  acquireDisplay(display);
  // Left bound on success: the caller's thread is about to issue desktop-GL calls.
  if (eglBindAPI(EGL_OPENGL_API) != EGL_TRUE) {
    *why = failure("eglBindAPI(EGL_OPENGL_API)");
    releaseDisplay(display);
    return false;
  }
  const EGLint configAttributes[] = {EGL_SURFACE_TYPE, EGL_PBUFFER_BIT, EGL_RENDERABLE_TYPE, EGL_OPENGL_BIT,
                                     EGL_NONE};
  EGLConfig config = nullptr;
  EGLint numConfigs = 0;
  if (eglChooseConfig(display, configAttributes, &config, 1, &numConfigs) != EGL_TRUE) {
    *why = failure("eglChooseConfig");
    releaseDisplay(display);
    return false;
  }
  if (numConfigs < 1) {
    *why = "eglChooseConfig found no desktop-GL pbuffer config";
    releaseDisplay(display);
    return false;
  }
  EGLContext made = eglCreateContext(display, config, EGL_NO_CONTEXT, nullptr);
  if (made == EGL_NO_CONTEXT) {
    *why = failure("eglCreateContext");
    releaseDisplay(display);
    return false;
  }
  if (eglMakeCurrent(display, EGL_NO_SURFACE, EGL_NO_SURFACE, made) != EGL_TRUE) {
    *why = failure("eglMakeCurrent without a surface");
    eglDestroyContext(display, made);
    releaseDisplay(display);
    return false;
  }
  *context = made;
  return true;
}

}  // namespace

std::optional<GLVersion> parseGLVersion(const char* text) {
  if (text == nullptr) return std::nullopt;
  const char* p = text;
  // OpenGL ES strings put the version after a profile name ("OpenGL ES 3.2 ..."); desktop GL starts
  // with it.
  while (*p != '\0' && !std::isdigit(static_cast<unsigned char>(*p))) ++p;
  GLVersion version;
  if (!std::isdigit(static_cast<unsigned char>(*p))) return std::nullopt;
  for (; std::isdigit(static_cast<unsigned char>(*p)); ++p) version.major = version.major * 10 + (*p - '0');
  if (*p != '.') return std::nullopt;
  ++p;
  if (!std::isdigit(static_cast<unsigned char>(*p))) return std::nullopt;
  for (; std::isdigit(static_cast<unsigned char>(*p)); ++p) version.minor = version.minor * 10 + (*p - '0');
  return version;
}

bool versionAtLeast(const GLVersion& version, int major, int minor) {
  return version.major > major || (version.major == major && version.minor >= minor);
}

std::string currentGLVersionString() {
  // No GL library, no context.
  if (!TessikSDK::GL::load()) return std::string();
  const GLubyte* text = glGetString(GL_VERSION);
  return text == nullptr ? std::string() : std::string(reinterpret_cast<const char*>(text));
}

bool glVersionAtLeast(int major, int minor) {
  const std::string text = currentGLVersionString();
  const std::optional<GLVersion> version = parseGLVersion(text.c_str());
  return version.has_value() && versionAtLeast(*version, major, minor);
}

std::optional<HeadlessGLContext> HeadlessGLContext::create(std::string* error) {
  std::string log;
  std::string why;
  EGLContext context = EGL_NO_CONTEXT;
  if (!egl().ok) {
    if (error != nullptr)
      *error =
          std::string("no headless OpenGL context could be created: libEGL.so.1 could not be loaded.\n") +
          kInstallHint;
    return std::nullopt;
  }

  auto getPlatformDisplay =
      reinterpret_cast<PFNEGLGETPLATFORMDISPLAYEXTPROC>(eglGetProcAddress("eglGetPlatformDisplayEXT"));
  if (getPlatformDisplay == nullptr) {
    log += "surfaceless platform: eglGetPlatformDisplayEXT is not available\n";
  } else {
    EGLDisplay display = getPlatformDisplay(EGL_PLATFORM_SURFACELESS_MESA, EGL_DEFAULT_DISPLAY, nullptr);
    if (makeContextOn(display, &context, &why)) return HeadlessGLContext(display, context, "surfaceless");
    log += "surfaceless platform: " + why + "\n";
  }

  // NVIDIA's EGL serves a GPU-backed display here even without an X server.
  EGLDisplay defaultDisplay = eglGetDisplay(EGL_DEFAULT_DISPLAY);
  if (makeContextOn(defaultDisplay, &context, &why))
    return HeadlessGLContext(defaultDisplay, context, "default");
  log += "default display: " + why + "\n";

  auto queryDevices = reinterpret_cast<PFNEGLQUERYDEVICESEXTPROC>(eglGetProcAddress("eglQueryDevicesEXT"));
  if (getPlatformDisplay == nullptr || queryDevices == nullptr) {
    log += "device platform: eglQueryDevicesEXT is not available\n";
  } else {
    constexpr EGLint kMaxDevices = 16;
    EGLDeviceEXT devices[kMaxDevices];
    EGLint numDevices = 0;
    if (queryDevices(kMaxDevices, devices, &numDevices) != EGL_TRUE) {
      log += "device platform: " + failure("eglQueryDevicesEXT") + "\n";
    } else if (numDevices == 0) {
      log += "device platform: no EGL devices\n";
    }
    for (EGLint i = 0; i < numDevices; ++i) {
      EGLDisplay display = getPlatformDisplay(EGL_PLATFORM_DEVICE_EXT, devices[i], nullptr);
      if (makeContextOn(display, &context, &why)) return HeadlessGLContext(display, context, "device");
      log += "device " + std::to_string(i) + ": " + why + "\n";
    }
  }

  if (error != nullptr) *error = "no headless OpenGL context could be created:\n" + log + kInstallHint;
  return std::nullopt;
}

HeadlessGLContext::HeadlessGLContext(void* display, void* context, std::string displayKind)
    : display_(display), context_(context), displayKind_(std::move(displayKind)) {}

HeadlessGLContext::HeadlessGLContext(HeadlessGLContext&& other) noexcept
    : display_(std::exchange(other.display_, nullptr)),
      context_(std::exchange(other.context_, nullptr)),
      displayKind_(std::exchange(other.displayKind_, std::string())) {}

HeadlessGLContext& HeadlessGLContext::operator=(HeadlessGLContext&& other) noexcept {
  if (this != &other) {
    release();
    display_ = std::exchange(other.display_, nullptr);
    context_ = std::exchange(other.context_, nullptr);
    displayKind_ = std::exchange(other.displayKind_, std::string());
  }
  return *this;
}

HeadlessGLContext::~HeadlessGLContext() { release(); }

bool HeadlessGLContext::makeCurrent() const {
  if (context_ == nullptr) return false;
  // Left bound on success, as in create(): GL calls follow on this thread.
  eglBindAPI(EGL_OPENGL_API);
  return eglMakeCurrent(display_, EGL_NO_SURFACE, EGL_NO_SURFACE, context_) == EGL_TRUE;
}

bool HeadlessGLContext::isCurrent() const {
  if (context_ == nullptr || !egl().ok) return false;
  ScopedOpenGLApi api;
  return eglGetCurrentContext() == context_;
}

void HeadlessGLContext::release() noexcept {
  if (context_ != nullptr) {
    {
      ScopedOpenGLApi api;
      if (eglGetCurrentContext() == context_) {
        eglMakeCurrent(display_, EGL_NO_SURFACE, EGL_NO_SURFACE, EGL_NO_CONTEXT);
      }
    }
    // A context still current on another thread is only marked for deletion; EGL frees it when that
    // thread lets go.
    eglDestroyContext(display_, context_);
    context_ = nullptr;
  }
  if (display_ != nullptr) {
    releaseDisplay(display_);
    display_ = nullptr;
  }
  displayKind_.clear();
}

bool ensureGLContext(std::optional<HeadlessGLContext>& made, std::string* error) {
  if (currentGLVersionString().empty()) {
    made = HeadlessGLContext::create(error);
    if (!made.has_value()) return false;
  }
  if (std::string why; !TessikSDK::GL::load(&why)) {
    if (error != nullptr) *error = "OpenGL entry points could not be loaded: " + why;
    made.reset();
    return false;
  }
  return true;
}

bool acquireGLForGpuWork(std::optional<HeadlessGLContext>& made, bool anyRenderer, std::string* error) {
  if (!ensureGLContext(made, error)) return false;
  if (anyRenderer || !TessikSDK::GL::softwareRenderer()) return true;
  made.reset();
  return false;
}

}  // namespace tessik::support
