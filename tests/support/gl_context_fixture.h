#pragma once

#include <cstdlib>
#include <optional>
#include <string>

#include <GL/glew.h>
#include <gtest/gtest.h>

#include "headless_gl/headless_gl.h"

namespace tessik::test {

// Gives each test a current headless OpenGL context. Without one the test is skipped on a developer
// machine, but fails when CI is set, where a missing driver would otherwise silently hide GPU tests.
class GLContextTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string error;
    context = support::HeadlessGLContext::create(&error);
    if (!context.has_value()) {
      if (std::getenv("CI") != nullptr) {
        FAIL() << error;
      } else {
        GTEST_SKIP() << error;
      }
    }
    // Debian's GLEW is built for GLX: in an EGL context it loads every entry point, then reports only
    // that it found no X display.
    const GLenum glew = glewInit();
    ASSERT_TRUE(glew == GLEW_OK || glew == GLEW_ERROR_NO_GLX_DISPLAY) << glewGetErrorString(glew);
  }

  std::optional<support::HeadlessGLContext> context;
};

}  // namespace tessik::test
