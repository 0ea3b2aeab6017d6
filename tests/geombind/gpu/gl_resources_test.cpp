#include "geombind/gpu/gl_resources.h"

#include <array>
#include <iostream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include <GL/glew.h>
#include <gtest/gtest.h>

#include "support/gl_context_fixture.h"

namespace TessikSDK::GeomBind::Gpu {
namespace {

constexpr const char* kVertex = "#version 120\nvoid main() { gl_Position = gl_Vertex; }\n";
constexpr const char* kFragment = "#version 120\nvoid main() { gl_FragColor = vec4(1.0); }\n";
constexpr const char* kBroken = "#version 120\nvoid main() { gl_FragColor = vec4(1.0) }\n";

// Redirects std::cerr, where the library reports, for the lifetime of the object.
class CerrCapture {
 public:
  CerrCapture() : previous(std::cerr.rdbuf(text.rdbuf())) {}
  ~CerrCapture() { std::cerr.rdbuf(previous); }
  std::string str() const { return text.str(); }

 private:
  std::ostringstream text;
  std::streambuf* previous;
};

// Each test has a fresh context, so scanning the low names counts every object a wrapper left behind.
template <class IsName>
int liveNames(IsName isName) {
  int live = 0;
  for (GLuint name = 1; name <= 64; ++name) live += isName(name) == GL_TRUE ? 1 : 0;
  return live;
}
int liveShaders() {
  return liveNames([](GLuint name) { return glIsShader(name); });
}

std::array<GLint, 4> viewport() {
  std::array<GLint, 4> values{};
  glGetIntegerv(GL_VIEWPORT, values.data());
  return values;
}

TEST(FormatInfo, KnownFormatsAndZeroEntryForOthers) {
  struct Case {
    GLenum internalFormat;
    GLint components;
    GLenum format;
  };
  for (const Case& c : {Case{GL_R8, 1, GL_RED}, Case{GL_RGB8, 3, GL_RGB}, Case{GL_RGBA8, 4, GL_RGBA}}) {
    const FormatInfo info = formatInfo(c.internalFormat);
    EXPECT_EQ(info.components, c.components) << c.internalFormat;
    EXPECT_EQ(info.format, c.format) << c.internalFormat;
    EXPECT_EQ(info.type, static_cast<GLenum>(GL_UNSIGNED_BYTE)) << c.internalFormat;
  }
  for (int lookup = 0; lookup < 2; ++lookup) {
    const FormatInfo unknown = formatInfo(GL_RGBA32F);
    EXPECT_EQ(unknown.components, 0);
    EXPECT_EQ(unknown.format, 0u);
    EXPECT_EQ(unknown.type, 0u);
  }
}

TEST(FormatInfo, ConcurrentLookupsAndInsertionsAgree) {
  constexpr int kThreads = 8;
  std::vector<int> wrong(kThreads, 0);
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([t, &wrong] {
      for (int i = 0; i < 2000; ++i) {
        // Distinct unknown formats per thread force insertions while others read.
        const GLenum unknown = static_cast<GLenum>(0x10000 + t * 1000 + i % 200);
        const FormatInfo rgba = formatInfo(GL_RGBA8);
        const FormatInfo zero = formatInfo(unknown);
        const bool ok = rgba.components == 4 && rgba.format == GL_RGBA && zero.components == 0 &&
                        zero.format == 0 && zero.type == 0;
        wrong[t] += ok ? 0 : 1;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (int t = 0; t < kThreads; ++t) EXPECT_EQ(wrong[t], 0) << "thread " << t;
}

using ShaderLibraryNames = tessik::test::GLContextTest;

TEST_F(ShaderLibraryNames, TakenOrEmptyNamesKeepTheFirstObjects) {
  ShaderLibrary library;
  ASSERT_TRUE(library.createShader("vs", GL_VERTEX_SHADER, kVertex));
  ASSERT_TRUE(library.createShader("fs", GL_FRAGMENT_SHADER, kFragment));
  ASSERT_TRUE(library.createProgram("draw", {"vs", "missing", "fs"}));
  ShaderProgram* program = library.getProgram("draw");
  ASSERT_NE(program, nullptr);
  ASSERT_EQ(program->shaders.size(), 2u);
  const GLuint programId = program->id;
  const GLuint vertexId = program->shaders[0]->id;

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
  EXPECT_TRUE(glIsProgram(programId));
  EXPECT_TRUE(glIsShader(vertexId));
  EXPECT_EQ(library.getProgram(""), nullptr);
}

TEST_F(ShaderLibraryNames, ProgramWithoutKnownShadersIsReported) {
  ShaderLibrary library;
  CerrCapture err;
  EXPECT_FALSE(library.createProgram("empty", {"nope", "nada"}));
  EXPECT_EQ(err.str(), "No shaders specified for shader program empty\n");
  EXPECT_EQ(library.getProgram("empty"), nullptr);
}

TEST_F(ShaderLibraryNames, FailedCompileOrLinkIsLoggedAndDropped) {
  ShaderLibrary library;
  ASSERT_TRUE(library.createShader("vs", GL_VERTEX_SHADER, kVertex));
  ASSERT_TRUE(library.createShader("vs2", GL_VERTEX_SHADER, kVertex));
  CerrCapture err;
  EXPECT_FALSE(library.createShader("broken", GL_FRAGMENT_SHADER, kBroken));
  EXPECT_EQ(err.str().rfind("[ Shader broken ]: \n", 0), 0u) << err.str();
  EXPECT_EQ(liveShaders(), 2);
  // Two definitions of main() cannot link.
  EXPECT_FALSE(library.createProgram("twice", {"vs", "vs2"}));
  EXPECT_NE(err.str().find("[ ShaderProgram twice ]: \n"), std::string::npos) << err.str();
  EXPECT_EQ(library.getProgram("twice"), nullptr);
  EXPECT_EQ(liveNames([](GLuint name) { return glIsProgram(name); }), 0);
}

using ShaderCompile = tessik::test::GLContextTest;

TEST_F(ShaderCompile, SyntaxErrorPrintsLogAndLeavesNoObject) {
  Shader shader("frag", GL_FRAGMENT_SHADER);
  std::ostringstream out;
  ASSERT_TRUE(shader.compile(kFragment, true, out));
  EXPECT_EQ(liveShaders(), 1);
  const GLuint previous = shader.id;

  EXPECT_FALSE(shader.compile(kBroken, true, out));
  const std::string text = out.str();
  const std::string header = "[ Shader frag ]: \n";
  ASSERT_EQ(text.rfind(header, 0), 0u) << text;
  EXPECT_GT(text.size(), header.size() + 1) << "the log itself is missing";
  EXPECT_EQ(text.back(), '\n');
  EXPECT_EQ(shader.id, 0u);
  EXPECT_FALSE(glIsShader(previous));
  EXPECT_EQ(liveShaders(), 0);

  std::ostringstream quiet;
  EXPECT_FALSE(shader.compile(kBroken, false, quiet));
  EXPECT_EQ(quiet.str(), "");
}

TEST_F(ShaderCompile, NullSourceIsReportedAndDropsThePreviousObject) {
  Shader shader("vert", GL_VERTEX_SHADER);
  std::ostringstream out;
  ASSERT_TRUE(shader.compile(kVertex, true, out));
  EXPECT_EQ(out.str(), "") << "a clean compile has no log to print";
  EXPECT_FALSE(shader.compile(nullptr, true, out));
  EXPECT_EQ(out.str(), "No source provided to compile shader vert\n");
  EXPECT_EQ(shader.id, 0u);
  EXPECT_EQ(liveShaders(), 0);
}

TEST_F(ShaderCompile, ReleaseDetachesAndDeletesTheProgram) {
  Shader vertex("vert", GL_VERTEX_SHADER);
  Shader fragment("frag", GL_FRAGMENT_SHADER);
  std::ostringstream out;
  ASSERT_TRUE(vertex.compile(kVertex, false, out));
  ASSERT_TRUE(fragment.compile(kFragment, false, out));
  ShaderProgram program("draw", {&vertex, &fragment});
  ASSERT_TRUE(program.link(true, out));
  const GLuint id = program.id;
  GLint attached = 0;
  glGetProgramiv(id, GL_ATTACHED_SHADERS, &attached);
  EXPECT_EQ(attached, 2);

  program.release();
  EXPECT_EQ(program.id, 0u);
  EXPECT_TRUE(program.shaders.empty());
  EXPECT_FALSE(glIsProgram(id));
  EXPECT_TRUE(glIsShader(vertex.id) && glIsShader(fragment.id));
}

using GLObjects = tessik::test::GLContextTest;

TEST_F(GLObjects, CreateAgainReplacesTheOldObject) {
  const auto liveTextures = [] { return liveNames([](GLuint name) { return glIsTexture(name); }); };
  Texture2D texture;
  texture.create(GL_RGBA8, 4, 4, nullptr);
  const std::array<unsigned char, 16> pixels = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16};
  texture.create(GL_RGBA8, 2, 2, pixels.data());
  EXPECT_EQ(liveTextures(), 1);
  EXPECT_EQ(texture.width, 2u);
  std::array<unsigned char, 16> readBack{};
  texture.bind(0);
  glGetTexImage(GL_TEXTURE_2D, 0, GL_RGBA, GL_UNSIGNED_BYTE, readBack.data());
  for (GLenum name : {GL_TEXTURE_MAG_FILTER, GL_TEXTURE_MIN_FILTER, GL_TEXTURE_WRAP_S, GL_TEXTURE_WRAP_T}) {
    GLint value = 0;
    glGetTexParameteriv(GL_TEXTURE_2D, name, &value);
    EXPECT_EQ(value, name == GL_TEXTURE_WRAP_S || name == GL_TEXTURE_WRAP_T ? GL_CLAMP_TO_EDGE : GL_LINEAR);
  }
  texture.unbind(0);
  EXPECT_EQ(readBack, pixels);

  RenderBuffer depth;
  depth.create(GL_DEPTH_COMPONENT24, 4, 4);
  depth.create(GL_DEPTH_COMPONENT24, 2, 2);
  EXPECT_EQ(liveNames([](GLuint name) { return glIsRenderbuffer(name); }), 1);
  EXPECT_EQ(depth.height, 2u);

  FrameBuffer frame;
  frame.create(2, 2);
  ASSERT_TRUE(frame.attachColor(0, texture));
  const auto liveFrames = [] { return liveNames([](GLuint name) { return glIsFramebuffer(name); }); };
  EXPECT_EQ(liveFrames(), 1);
  // A generated framebuffer name only becomes an object once bound, so none is live right after.
  frame.create(2, 2);
  EXPECT_EQ(liveFrames(), 0);
  EXPECT_NE(frame.id, 0u);
  EXPECT_EQ(frame.colorAttachments.count(GL_COLOR_ATTACHMENT0), 1u);
}

TEST_F(GLObjects, AttachRefusesSizeMismatchWithoutTouchingGL) {
  struct Case {
    std::uint32_t width, height;
    bool fits;
  };
  for (const Case& c : {Case{8, 2, false}, Case{4, 4, false}, Case{8, 4, true}}) {
    Texture2D texture;
    texture.create(GL_R8, c.width, c.height, nullptr);
    RenderBuffer depth;
    depth.create(GL_DEPTH_COMPONENT24, c.width, c.height);
    FrameBuffer frame;
    frame.create(8, 4);
    EXPECT_EQ(frame.attachDepth(depth), c.fits) << c.width << "x" << c.height;
    EXPECT_EQ(frame.attachColor(3, texture), c.fits) << c.width << "x" << c.height;
    // Only a bind makes the framebuffer exist, so a refusal must leave it unborn.
    EXPECT_EQ(glIsFramebuffer(frame.id) == GL_TRUE, c.fits);
    EXPECT_EQ(frame.colorAttachments.size(), c.fits ? 1u : 0u);
  }
}

TEST_F(GLObjects, BindSelectsDrawBufferAndUnbindRestoresViewport) {
  Texture2D texture;
  texture.create(GL_RGBA8, 8, 4, nullptr);
  FrameBuffer frame;
  frame.create(8, 4);
  ASSERT_TRUE(frame.attachColor(1, texture));
  const std::array<GLint, 4> outside = {1, 2, 3, 5};
  struct Case {
    std::uint32_t index;
    GLint drawBuffer;
  };
  for (const Case& c : {Case{1, GL_COLOR_ATTACHMENT1}, Case{0, GL_NONE}, Case{2, GL_NONE}}) {
    glViewport(outside[0], outside[1], outside[2], outside[3]);
    frame.bind(c.index);
    GLint drawBuffer = -1;
    glGetIntegerv(GL_DRAW_BUFFER0, &drawBuffer);
    GLint bound = 0;
    glGetIntegerv(GL_FRAMEBUFFER_BINDING, &bound);
    EXPECT_EQ(drawBuffer, c.drawBuffer) << "index " << c.index;
    EXPECT_EQ(bound, static_cast<GLint>(frame.id));
    EXPECT_EQ(viewport(), (std::array<GLint, 4>{0, 0, 8, 4}));
    frame.unbind();
    glGetIntegerv(GL_FRAMEBUFFER_BINDING, &bound);
    EXPECT_EQ(bound, 0);
    EXPECT_EQ(viewport(), outside);
  }
}

TEST_F(GLObjects, DestructorsDeleteEveryObject) {
  GLuint texture = 0, renderBuffer = 0, frameBuffer = 0, program = 0;
  std::vector<GLuint> shaders;
  {
    Texture2D color;
    color.create(GL_RGB8, 2, 2, nullptr);
    RenderBuffer depth;
    depth.create(GL_DEPTH_COMPONENT24, 2, 2);
    FrameBuffer frame;
    frame.create(2, 2);
    ASSERT_TRUE(frame.attachColor(0, color));
    ShaderLibrary library;
    ASSERT_TRUE(library.createShader("vs", GL_VERTEX_SHADER, kVertex));
    ASSERT_TRUE(library.createShader("fs", GL_FRAGMENT_SHADER, kFragment));
    ASSERT_TRUE(library.createProgram("draw", {"vs", "fs"}));
    const ShaderProgram* linked = library.getProgram("draw");
    for (const Shader* shader : linked->shaders) shaders.push_back(shader->id);
    texture = color.id;
    renderBuffer = depth.id;
    frameBuffer = frame.id;
    program = linked->id;
    ASSERT_TRUE(glIsTexture(texture) && glIsRenderbuffer(renderBuffer) && glIsFramebuffer(frameBuffer));
    ASSERT_TRUE(glIsProgram(program) && glIsShader(shaders[0]) && glIsShader(shaders[1]));
  }
  EXPECT_FALSE(glIsTexture(texture));
  EXPECT_FALSE(glIsRenderbuffer(renderBuffer));
  EXPECT_FALSE(glIsFramebuffer(frameBuffer));
  EXPECT_FALSE(glIsProgram(program));
  for (GLuint shader : shaders) EXPECT_FALSE(glIsShader(shader));
}

}  // namespace
}  // namespace TessikSDK::GeomBind::Gpu
