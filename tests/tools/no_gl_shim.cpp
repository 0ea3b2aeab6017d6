// Preloaded into a process to make it behave as on a machine with no OpenGL installed: dlopen refuses
// every GL, EGL and GLEW library, and nothing else. The programs link none of them, so loading at run
// time is the only way they could reach one.

#include <cstring>
#include <initializer_list>

#include <dlfcn.h>

extern "C" void* dlopen(const char* file, int mode) {
  using Open = void* (*)(const char*, int);
  static const Open real = reinterpret_cast<Open>(dlsym(RTLD_NEXT, "dlopen"));
  if (file != nullptr) {
    const char* base = std::strrchr(file, '/');
    base = base != nullptr ? base + 1 : file;
    for (const char* hidden : {"libGL.", "libGLX", "libEGL", "libOpenGL", "libGLEW", "libGLdispatch"})
      if (std::strncmp(base, hidden, std::strlen(hidden)) == 0) return nullptr;
  }
  return real(file, mode);
}
