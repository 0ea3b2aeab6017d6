#pragma once

#include <cstdlib>
#include <optional>
#include <string>

#include <gtest/gtest.h>

#include "gl/gl_api.h"
#include "headless_gl/headless_gl.h"

namespace tessik::test {

// Gives each test a current headless OpenGL context. Without one the test is skipped on a developer
// machine, but fails when CI is set, where a missing driver would otherwise silently hide GPU tests.
class GLContextTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string error;
    if (!support::ensureGLContext(context, &error)) {
      if (std::getenv("CI") != nullptr) {
        FAIL() << error;
      } else {
        GTEST_SKIP() << error;
      }
    }
  }

  std::optional<support::HeadlessGLContext> context;
};

}  // namespace tessik::test
