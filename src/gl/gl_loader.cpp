#include <cstdio>
#include <cstring>
#include <initializer_list>

#include <dlfcn.h>

#include "gl/gl_api.h"

namespace TessikSDK::GL {

namespace {

using ProcLookup = void* (*)(const char*);

// A library the process already has is the one its context came from; otherwise the usual names.
void* openFirst(std::initializer_list<const char*> names) {
  for (const char* name : names)
    if (void* handle = dlopen(name, RTLD_NOW | RTLD_LOCAL | RTLD_NOLOAD)) return handle;
  for (const char* name : names)
    if (void* handle = dlopen(name, RTLD_NOW | RTLD_LOCAL)) return handle;
  return nullptr;
}

ProcLookup lookupIn(void* library, const char* symbol) {
  return library != nullptr ? reinterpret_cast<ProcLookup>(dlsym(library, symbol)) : nullptr;
}

// Newer entry points come from the window-system layer: EGL's when the process already uses EGL, else
// GLX's from libGL, else EGL's after all. Either hands out dispatch stubs that serve any current context.
ProcLookup procLookup(void* gl) {
  if (ProcLookup egl =
          lookupIn(dlopen("libEGL.so.1", RTLD_NOW | RTLD_LOCAL | RTLD_NOLOAD), "eglGetProcAddress"))
    return egl;
  if (ProcLookup glx = lookupIn(gl, "glXGetProcAddressARB")) return glx;
  return lookupIn(dlopen("libEGL.so.1", RTLD_NOW | RTLD_LOCAL), "eglGetProcAddress");
}

struct LoadResult {
  bool ok = false;
  std::string why;
  Functions functions;
};

LoadResult loadOnce() {
  // The handles stay open for the life of the process, as the driver behind them must.
  void* gl = openFirst({"libOpenGL.so.0", "libGL.so.1"});
  if (gl == nullptr) return {false, "no OpenGL library could be loaded (libOpenGL.so.0 or libGL.so.1)", {}};
  const ProcLookup lookup = procLookup(gl);
  Functions loaded;
  std::string missing;
  auto resolve = [&](const char* name, bool required) -> void* {
    void* entry = dlsym(gl, name);
    if (entry == nullptr && lookup != nullptr) entry = lookup(name);
    if (entry == nullptr && required) missing = name;
    return entry;
  };
#define TESSIK_GL_CORE(name) loaded.name = reinterpret_cast<decltype(loaded.name)>(resolve("gl" #name, true));
#define TESSIK_GL_EXT(name) loaded.name = reinterpret_cast<decltype(loaded.name)>(resolve("gl" #name, false));
#include "gl/gl_functions.inc"
#undef TESSIK_GL_CORE
#undef TESSIK_GL_EXT
  if (!missing.empty()) return {false, "the OpenGL library lacks " + missing, {}};
  return {true, {}, loaded};
}

const LoadResult& loaded() {
  static const LoadResult result = loadOnce();
  return result;
}

}  // namespace

const Functions& api() { return loaded().functions; }

bool load(std::string* why) {
  if (!loaded().ok && why != nullptr) *why = loaded().why;
  return loaded().ok;
}

bool libraryInProcess() {
  for (const char* name : {"libOpenGL.so.0", "libGL.so.1"}) {
    if (void* handle = dlopen(name, RTLD_NOW | RTLD_LOCAL | RTLD_NOLOAD)) {
      dlclose(handle);  // drops only the reference RTLD_NOLOAD took
      return true;
    }
  }
  return false;
}

bool softwareRenderer() {
  if (api().GetString == nullptr) return false;
  const auto* renderer = reinterpret_cast<const char*>(api().GetString(GL_RENDERER));
  if (renderer == nullptr) return false;
  for (const char* software : {"llvmpipe", "softpipe", "swrast"})
    if (std::strstr(renderer, software) != nullptr) return true;
  return false;
}

bool versionAtLeast(int major, int minor) {
  if (api().GetString == nullptr) return false;
  const auto* version = reinterpret_cast<const char*>(api().GetString(GL_VERSION));
  int haveMajor = 0, haveMinor = 0;
  // "4.5 (Compatibility Profile) Mesa ...", "2.1 NVIDIA ...", or "OpenGL ES 3.2 ..." which is not OpenGL.
  if (version == nullptr || std::sscanf(version, "%d.%d", &haveMajor, &haveMinor) != 2) return false;
  return haveMajor > major || (haveMajor == major && haveMinor >= minor);
}

bool hasExtension(const char* name) {
  if (api().GetString == nullptr || name == nullptr) return false;
  const std::size_t length = std::strlen(name);
  if (const auto* all = reinterpret_cast<const char*>(api().GetString(GL_EXTENSIONS))) {
    for (const char* at = std::strstr(all, name); at != nullptr; at = std::strstr(at + length, name)) {
      const bool starts = at == all || at[-1] == ' ';
      const bool ends = at[length] == '\0' || at[length] == ' ';
      if (starts && ends) return true;
    }
    return false;
  }
  // Core profiles list extensions one by one only.
  if (api().GetStringi == nullptr || api().GetIntegerv == nullptr) return false;
  GLint count = 0;
  api().GetIntegerv(GL_NUM_EXTENSIONS, &count);
  for (GLint i = 0; i < count; ++i) {
    const auto* extension =
        reinterpret_cast<const char*>(api().GetStringi(GL_EXTENSIONS, static_cast<GLuint>(i)));
    if (extension != nullptr && std::strcmp(extension, name) == 0) return true;
  }
  return false;
}

}  // namespace TessikSDK::GL
