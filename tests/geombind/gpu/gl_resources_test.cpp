#include "geombind/gpu/gl_resources.h"

#include <array>
#include <cstdint>
#include <iostream>
#include <sstream>
#include <string>
#include <thread>
#include <tuple>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "gl/gl_api.h"
#include "support/gl_context_fixture.h"

namespace TessikSDK::GeomBind::Gpu {
namespace {

constexpr const char* kVertex = "#version 120\nvoid main() { gl_Position = gl_Vertex; }\n";
constexpr const char* kFragment = "#version 120\nvoid main() { gl_FragColor = vec4(1.0); }\n";
constexpr const char* kBroken = "#version 120\nvoid main() { gl_FragColor = vec4(1.0) }\n";

// Redirects std::cerr, where the library reports, into itself for its lifetime.
struct CerrCapture : std::ostringstream {
  std::streambuf* previous = std::cerr.rdbuf(rdbuf());
  ~CerrCapture() override { std::cerr.rdbuf(previous); }
};

// Each test has a fresh context, so scanning the low names counts every object a wrapper left behind.
template <class IsName>
int liveNames(IsName isName) {
  int live = 0;
  for (GLuint name = 1; name <= 64; ++name) live += isName(name) == GL_TRUE ? 1 : 0;
  return live;
}

TEST(FormatInfo, KnownFormatsAndZeroEntryForOthersAlsoUnderConcurrentLookups) {
  const std::pair<GLenum, FormatInfo> table[] = {{GL_R8, {1, GL_RED, GL_UNSIGNED_BYTE}},
                                                 {GL_RGB8, {3, GL_RGB, GL_UNSIGNED_BYTE}},
                                                 {GL_RGBA8, {4, GL_RGBA, GL_UNSIGNED_BYTE}},
                                                 {GL_RGBA32F, {0, 0, 0}}};
  const auto key = [](const FormatInfo& f) { return std::tuple(f.components, f.format, f.type); };
  const auto matches = [&](GLenum format, const FormatInfo& expected) {
    return key(formatInfo(format)) == key(expected);
  };
  for (const auto& [format, expected] : table) EXPECT_TRUE(matches(format, expected)) << format;
  std::vector<int> wrong(8, 0);
  std::vector<std::thread> threads;
  // Distinct unknown formats per thread force insertions while others read.
  for (int t = 0; t < 8; ++t)
    threads.emplace_back([&, t] {
      for (int i = 0; i < 2000; ++i)
        wrong[t] += !matches(table[i % 4].first, table[i % 4].second) +
                    !matches(static_cast<GLenum>(0x10000 + t * 1000 + i % 200), FormatInfo{});
    });
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(wrong, std::vector<int>(8, 0));
}

using ShaderLibraryTest = tessik::test::GLContextTest;

TEST_F(ShaderLibraryTest, RefusesTakenOrEmptyNamesAndLogsFailuresLeavingNoObject) {
  {
    ShaderLibrary library;
    ASSERT_TRUE(library.createShader("vs", GL_VERTEX_SHADER, kVertex));
    ASSERT_TRUE(library.createShader("vs2", GL_VERTEX_SHADER, kVertex));
    ASSERT_TRUE(library.createShader("fs", GL_FRAGMENT_SHADER, kFragment));
    ASSERT_TRUE(library.createProgram("draw", {"vs", "missing", "fs"}));
    ShaderProgram* program = library.getProgram("draw");
    ASSERT_TRUE(program != nullptr && program->shaders.size() == 2u) << "unknown shader names are skipped";
    const GLuint programId = program->id, vertexId = program->shaders[0]->id;
    CerrCapture err;
    // A broken source proves the name is refused before anything is compiled.
    EXPECT_FALSE(library.createShader("vs", GL_VERTEX_SHADER, kBroken));
    EXPECT_FALSE(library.createShader("", GL_VERTEX_SHADER, kVertex));
    EXPECT_FALSE(library.createProgram("draw", {"fs"}));
    EXPECT_FALSE(library.createProgram("", {"vs", "fs"}));
    EXPECT_EQ(err.str(), "");
    EXPECT_EQ(library.getProgram("draw"), program);
    EXPECT_EQ(program->id, programId);
    EXPECT_EQ(program->shaders[0]->id, vertexId);
    EXPECT_TRUE(glIsProgram(programId) && glIsShader(vertexId));

    EXPECT_FALSE(library.createProgram("empty", {"nope", "nada"}));
    EXPECT_FALSE(library.createShader("broken", GL_FRAGMENT_SHADER, kBroken));
    // Two definitions of main() cannot link.
    EXPECT_FALSE(library.createProgram("twice", {"vs", "vs2"}));
    EXPECT_EQ(err.str().rfind("No shaders specified for shader program empty\n[ Shader broken ]: \n", 0), 0u)
        << err.str();
    EXPECT_NE(err.str().find("[ ShaderProgram twice ]: \n"), std::string::npos) << err.str();
    EXPECT_TRUE(library.getProgram("empty") == nullptr && library.getProgram("twice") == nullptr);
    EXPECT_EQ(liveNames(glIsShader), 3);
    EXPECT_EQ(liveNames(glIsProgram), 1);
  }
  // The library's destructor deletes its programs and shaders.
  EXPECT_EQ(liveNames(glIsShader) + liveNames(glIsProgram), 0);
}

TEST_F(ShaderLibraryTest, FailedOrNullCompilePrintsAndDropsThePreviousObject) {
  Shader shader("frag", GL_FRAGMENT_SHADER);
  std::ostringstream out;
  ASSERT_TRUE(shader.compile(kFragment, true, out));
  EXPECT_EQ(out.str(), "") << "a clean compile has no log to print";
  const GLuint previous = shader.id;
  EXPECT_FALSE(shader.compile(kBroken, true, out));
  const std::string header = "[ Shader frag ]: \n";
  ASSERT_EQ(out.str().rfind(header, 0), 0u) << out.str();
  EXPECT_GT(out.str().size(), header.size() + 1) << "the log itself is missing";
  EXPECT_FALSE(glIsShader(previous));
  std::ostringstream quiet;
  EXPECT_FALSE(shader.compile(kBroken, false, quiet));
  EXPECT_EQ(quiet.str(), "");
  ASSERT_TRUE(shader.compile(kFragment, false, quiet));
  EXPECT_FALSE(shader.compile(nullptr, true, quiet));
  EXPECT_EQ(quiet.str(), "No source provided to compile shader frag\n");
  EXPECT_EQ(shader.id, 0u);
  EXPECT_EQ(liveNames(glIsShader), 0);
}

using GLObjects = tessik::test::GLContextTest;

TEST_F(GLObjects, CreateAgainReplacesTheOldObjectAndDestructorsDeleteIt) {
  {
    Texture2D texture;
    texture.create(GL_RGBA8, 4, 4, nullptr);
    const std::array<unsigned char, 16> pixels = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16};
    texture.create(GL_RGBA8, 2, 2, pixels.data());
    EXPECT_EQ(liveNames(glIsTexture), 1);
    std::array<unsigned char, 16> readBack{};
    texture.bind(0);
    glGetTexImage(GL_TEXTURE_2D, 0, GL_RGBA, GL_UNSIGNED_BYTE, readBack.data());
    EXPECT_EQ(readBack, pixels);
    for (GLenum name : {GL_TEXTURE_MAG_FILTER, GL_TEXTURE_MIN_FILTER, GL_TEXTURE_WRAP_S, GL_TEXTURE_WRAP_T}) {
      GLint value = 0;
      glGetTexParameteriv(GL_TEXTURE_2D, name, &value);
      EXPECT_EQ(value, name == GL_TEXTURE_WRAP_S || name == GL_TEXTURE_WRAP_T ? GL_CLAMP_TO_EDGE : GL_LINEAR);
    }
    RenderBuffer depth;
    depth.create(GL_DEPTH_COMPONENT24, 4, 4);
    depth.create(GL_DEPTH_COMPONENT24, 2, 2);
    EXPECT_EQ(liveNames(glIsRenderbuffer), 1);
    FrameBuffer frame;
    frame.create(2, 2);
    ASSERT_TRUE(frame.attachColor(0, texture));
    EXPECT_EQ(liveNames(glIsFramebuffer), 1);
    // A generated framebuffer name only becomes an object once bound, so none is live right after.
    frame.create(2, 2);
    EXPECT_EQ(liveNames(glIsFramebuffer), 0);
    EXPECT_EQ(frame.colorAttachments.count(GL_COLOR_ATTACHMENT0), 1u);
    ASSERT_TRUE(frame.attachDepth(depth));  // binds, so the framebuffer exists again for the destructor
  }
  EXPECT_EQ(liveNames(glIsTexture) + liveNames(glIsRenderbuffer) + liveNames(glIsFramebuffer), 0);
}

TEST_F(GLObjects, AttachRefusesSizeMismatchAndBindSelectsDrawBufferAndRestoresViewport) {
  FrameBuffer frame;
  frame.create(8, 4);
  const std::pair<std::uint32_t, std::uint32_t> wrongSizes[] = {{8, 2}, {4, 4}};
  for (const auto& [width, height] : wrongSizes) {
    Texture2D texture;
    texture.create(GL_R8, width, height, nullptr);
    RenderBuffer depth;
    depth.create(GL_DEPTH_COMPONENT24, width, height);
    EXPECT_FALSE(frame.attachDepth(depth)) << width << "x" << height;
    EXPECT_FALSE(frame.attachColor(3, texture)) << width << "x" << height;
  }
  // Only a bind makes the framebuffer exist, so the refusals must have left it unborn.
  EXPECT_FALSE(glIsFramebuffer(frame.id));
  EXPECT_TRUE(frame.colorAttachments.empty());
  Texture2D texture;
  texture.create(GL_RGBA8, 8, 4, nullptr);
  RenderBuffer depth;
  depth.create(GL_DEPTH_COMPONENT24, 8, 4);
  ASSERT_TRUE(frame.attachDepth(depth));
  ASSERT_TRUE(frame.attachColor(1, texture));
  const auto state = [](GLenum name, int count) {
    std::array<GLint, 4> values{-1, -1, -1, -1};
    glGetIntegerv(name, values.data());
    return std::vector<GLint>(values.begin(), values.begin() + count);
  };
  // Indices 0 and 2 were never attached.
  const std::pair<std::uint32_t, GLenum> cases[] = {{1, GL_COLOR_ATTACHMENT1}, {0, GL_NONE}, {2, GL_NONE}};
  for (const auto& [index, drawBuffer] : cases) {
    glViewport(1, 2, 3, 5);
    frame.bind(index);
    EXPECT_EQ(state(GL_DRAW_BUFFER0, 1), std::vector<GLint>{static_cast<GLint>(drawBuffer)}) << index;
    EXPECT_EQ(state(GL_FRAMEBUFFER_BINDING, 1), std::vector<GLint>{static_cast<GLint>(frame.id)});
    EXPECT_EQ(state(GL_VIEWPORT, 4), (std::vector<GLint>{0, 0, 8, 4}));
    frame.unbind();
    EXPECT_EQ(state(GL_FRAMEBUFFER_BINDING, 1), std::vector<GLint>{0});
    EXPECT_EQ(state(GL_VIEWPORT, 4), (std::vector<GLint>{1, 2, 3, 5}));
  }
}

}  // namespace
}  // namespace TessikSDK::GeomBind::Gpu
