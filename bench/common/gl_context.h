#pragma once

#include <optional>
#include <string>

#include "gl/gl_api.h"
#include "headless_gl/headless_gl.h"

// The benchmarks' one headless OpenGL context, made on first use so that a run filtered down to nothing
// GL-related never needs a driver. Call releaseGL() at the end of main(), while the driver is still
// loaded, rather than leaving it to static destruction.
namespace tessik::bench {

struct GLState {
  bool tried = false;
  std::optional<support::HeadlessGLContext> context;
  std::string error;
};

inline GLState& theGL() {
  static GLState state;
  return state;
}

/// Empty when a context is current on this thread, otherwise why there is none.
inline const std::string& ensureGL() {
  GLState& gl = theGL();
  if (!gl.tried) {
    gl.tried = true;
    if (!support::ensureGLContext(gl.context, &gl.error) && gl.error.empty())
      gl.error = "no headless OpenGL context";
  }
  return gl.error;
}

inline void releaseGL() { theGL().context.reset(); }

}  // namespace tessik::bench
