#pragma once

#include <cstdint>
#include <iosfwd>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "gl/gl_api.h"

// Owning wrappers of the OpenGL objects the voxelizer needs. Each holds one GL name, deletes it on
// destruction after the matching glIs... test, and is used only on the thread whose GL context is
// current. The entry points come from the table of gl/gl_api.h, loaded on first use.
namespace TessikSDK::GeomBind::Gpu {

/// Component count, pixel format and pixel type of a texture internal format.
struct FormatInfo {
  GLint components = 0;
  GLenum format = 0;
  GLenum type = 0;
};

/// GL_R8, GL_RGB8 and GL_RGBA8 are known; any other format gets (and keeps) a zero entry. The table is
/// built once, on first use, safely from any thread.
FormatInfo formatInfo(GLenum internalFormat);

class Texture2D {
 public:
  Texture2D() = default;
  ~Texture2D();
  Texture2D(const Texture2D&) = delete;
  Texture2D& operator=(const Texture2D&) = delete;

  /// (Re)creates the texture: linear filtering, clamp-to-edge wrapping; `data` may be null.
  void create(GLenum internalFormat, std::uint32_t width, std::uint32_t height, const void* data);
  void setParameter(GLenum name, GLint value);
  void bind(std::uint32_t unit) const;
  void unbind(std::uint32_t unit) const;

  GLuint id = 0;
  std::uint32_t width = 0;
  std::uint32_t height = 0;
  GLenum internalFormat = 0;

 private:
  /// Deletes the texture (behind glIsTexture) and zeroes the fields.
  void release();
};

class RenderBuffer {
 public:
  RenderBuffer() = default;
  ~RenderBuffer();
  RenderBuffer(const RenderBuffer&) = delete;
  RenderBuffer& operator=(const RenderBuffer&) = delete;

  void create(GLenum internalFormat, std::uint32_t width, std::uint32_t height);

  GLuint id = 0;
  std::uint32_t width = 0;
  std::uint32_t height = 0;
  GLenum internalFormat = 0;

 private:
  void release();
};

class FrameBuffer {
 public:
  FrameBuffer() = default;
  ~FrameBuffer();
  FrameBuffer(const FrameBuffer&) = delete;
  FrameBuffer& operator=(const FrameBuffer&) = delete;

  /// (Re)creates the framebuffer object; the set of attached colour enums is kept.
  void create(std::uint32_t width, std::uint32_t height);
  /// False, without a GL call, when the texture's size differs from the framebuffer's.
  bool attachColor(std::uint32_t index, const Texture2D& texture);
  bool attachDepth(const RenderBuffer& renderBuffer);
  /// Saves the viewport, sets it to the framebuffer's size, binds, and draws into colour attachment
  /// `index` (GL_NONE when that attachment was never made).
  void bind(std::uint32_t index);
  /// Restores the saved viewport, binds framebuffer 0 and selects GL_BACK.
  void unbind();

  GLuint id = 0;
  std::uint32_t width = 0;
  std::uint32_t height = 0;
  GLint savedViewport[4] = {0, 0, 0, 0};
  std::set<GLenum> colorAttachments;
};

class Shader {
 public:
  Shader(std::string name, GLenum stage);
  ~Shader();
  Shader(const Shader&) = delete;
  Shader& operator=(const Shader&) = delete;

  /// Compiles `source` (null is refused). With `verbose`, problems and the info log go to `out`. A
  /// failed compile leaves no GL object behind.
  bool compile(const char* source, bool verbose, std::ostream& out);
  void printInfoLog(std::ostream& out) const;

  GLuint id = 0;
  std::string name;
  GLenum stage;
};

class ShaderProgram {
 public:
  /// The shaders are not owned; they must outlive the program.
  ShaderProgram(std::string name, std::vector<Shader*> shaders);
  ~ShaderProgram();
  ShaderProgram(const ShaderProgram&) = delete;
  ShaderProgram& operator=(const ShaderProgram&) = delete;

  bool link(bool verbose, std::ostream& out);
  void printInfoLog(std::ostream& out) const;
  /// Detaches the shaders and deletes the program; nothing when there is no program.
  void release();

  GLuint id = 0;
  std::string name;
  std::vector<Shader*> shaders;
};

/// Shaders and programs by name. Compile and link problems are written to std::cerr.
class ShaderLibrary {
 public:
  ShaderLibrary() = default;
  /// Deletes every program, then every shader.
  ~ShaderLibrary();
  ShaderLibrary(const ShaderLibrary&) = delete;
  ShaderLibrary& operator=(const ShaderLibrary&) = delete;

  /// False for an empty or taken name, or when the source does not compile.
  bool createShader(const std::string& name, GLenum stage, const char* source);
  /// False for an empty or taken name, or when linking fails; unknown shader names are skipped.
  bool createProgram(const std::string& name, const std::vector<std::string>& shaderNames);
  /// Null when there is no program of that name.
  ShaderProgram* getProgram(const std::string& name) const;

 private:
  std::map<std::string, std::unique_ptr<Shader>> shaders;
  std::map<std::string, std::unique_ptr<ShaderProgram>> programs;
};

}  // namespace TessikSDK::GeomBind::Gpu
