#include "geombind/gpu/gl_resources.h"

#include <iostream>
#include <map>
#include <mutex>
#include <ostream>
#include <utility>

namespace TessikSDK::GeomBind::Gpu {

namespace {

// Unknown formats are inserted on lookup, so every access, not only the first, must hold the lock.
struct FormatTable {
  std::mutex mutex;
  std::map<GLenum, FormatInfo> entries{
      {GL_R8, {1, GL_RED, GL_UNSIGNED_BYTE}},
      {GL_RGB8, {3, GL_RGB, GL_UNSIGNED_BYTE}},
      {GL_RGBA8, {4, GL_RGBA, GL_UNSIGNED_BYTE}},
  };
};

FormatTable& formatTable() {
  static FormatTable table;
  return table;
}

// Shared by both info-log printers; getLength and getLog are glGet{Shader,Program}iv/InfoLog.
template <class GetLength, class GetLog>
void writeInfoLog(
    std::ostream& out, const char* kind, const std::string& name, GetLength getLength, GetLog getLog) {
  GLint length = 0;
  getLength(&length);
  // Drivers report 1 (just the terminator) or 0 for an empty log.
  if (length <= 1) return;
  std::vector<GLchar> log(static_cast<std::size_t>(length), '\0');
  getLog(length, log.data());
  out << "[ " << kind << " " << name << " ]: " << std::endl << log.data() << std::endl;
}

}  // namespace

FormatInfo formatInfo(GLenum internalFormat) {
  FormatTable& table = formatTable();
  std::lock_guard<std::mutex> lock(table.mutex);
  return table.entries[internalFormat];
}

Texture2D::~Texture2D() { release(); }

void Texture2D::release() {
  if (glIsTexture(id)) glDeleteTextures(1, &id);
  id = 0;
  width = 0;
  height = 0;
  internalFormat = 0;
}

void Texture2D::create(GLenum newFormat, std::uint32_t newWidth, std::uint32_t newHeight, const void* data) {
  release();
  internalFormat = newFormat;
  width = newWidth;
  height = newHeight;
  glGenTextures(1, &id);
  const FormatInfo info = formatInfo(internalFormat);
  glActiveTexture(GL_TEXTURE0);
  glBindTexture(GL_TEXTURE_2D, id);
  glTexImage2D(GL_TEXTURE_2D, 0, static_cast<GLint>(internalFormat), static_cast<GLsizei>(width),
               static_cast<GLsizei>(height), 0, info.format, info.type, data);
  setParameter(GL_TEXTURE_MAG_FILTER, GL_LINEAR);
  setParameter(GL_TEXTURE_MIN_FILTER, GL_LINEAR);
  setParameter(GL_TEXTURE_WRAP_S, GL_CLAMP_TO_EDGE);
  setParameter(GL_TEXTURE_WRAP_T, GL_CLAMP_TO_EDGE);
  unbind(0);
}

void Texture2D::setParameter(GLenum name, GLint value) {
  glActiveTexture(GL_TEXTURE0);
  glBindTexture(GL_TEXTURE_2D, id);
  glTexParameteri(GL_TEXTURE_2D, name, value);
  glActiveTexture(GL_TEXTURE0);
  glBindTexture(GL_TEXTURE_2D, 0);
}

void Texture2D::bind(std::uint32_t unit) const {
  glActiveTexture(GL_TEXTURE0 + unit);
  glBindTexture(GL_TEXTURE_2D, id);
}

void Texture2D::unbind(std::uint32_t unit) const {
  glActiveTexture(GL_TEXTURE0 + unit);
  glBindTexture(GL_TEXTURE_2D, 0);
}

RenderBuffer::~RenderBuffer() { release(); }

void RenderBuffer::release() {
  if (glIsRenderbuffer(id)) glDeleteRenderbuffers(1, &id);
  id = 0;
  width = 0;
  height = 0;
  internalFormat = 0;
}

void RenderBuffer::create(GLenum newFormat, std::uint32_t newWidth, std::uint32_t newHeight) {
  release();
  internalFormat = newFormat;
  width = newWidth;
  height = newHeight;
  glGenRenderbuffers(1, &id);
  glBindRenderbuffer(GL_RENDERBUFFER, id);
  glRenderbufferStorage(GL_RENDERBUFFER, internalFormat, static_cast<GLsizei>(width),
                        static_cast<GLsizei>(height));
  glBindRenderbuffer(GL_RENDERBUFFER, 0);
}

FrameBuffer::~FrameBuffer() {
  if (glIsFramebuffer(id)) glDeleteFramebuffers(1, &id);
  id = 0;
  width = 0;
  height = 0;
  for (GLint& value : savedViewport) value = 0;
  colorAttachments.clear();
}

void FrameBuffer::create(std::uint32_t newWidth, std::uint32_t newHeight) {
  if (glIsFramebuffer(id)) {
    glDeleteFramebuffers(1, &id);
    id = 0;
    width = 0;
    height = 0;
  }
  width = newWidth;
  height = newHeight;
  glGenFramebuffers(1, &id);
}

bool FrameBuffer::attachColor(std::uint32_t index, const Texture2D& texture) {
  if (texture.width != width || texture.height != height) return false;
  const GLenum attachment = GL_COLOR_ATTACHMENT0 + index;
  glBindFramebuffer(GL_FRAMEBUFFER, id);
  glFramebufferTexture2D(GL_FRAMEBUFFER, attachment, GL_TEXTURE_2D, texture.id, 0);
  glBindFramebuffer(GL_FRAMEBUFFER, 0);
  colorAttachments.insert(attachment);
  return true;
}

bool FrameBuffer::attachDepth(const RenderBuffer& renderBuffer) {
  if (renderBuffer.width != width || renderBuffer.height != height) return false;
  glBindFramebuffer(GL_FRAMEBUFFER, id);
  glFramebufferRenderbuffer(GL_FRAMEBUFFER, GL_DEPTH_ATTACHMENT, GL_RENDERBUFFER, renderBuffer.id);
  glBindFramebuffer(GL_FRAMEBUFFER, 0);
  return true;
}

void FrameBuffer::bind(std::uint32_t index) {
  glGetIntegerv(GL_VIEWPORT, savedViewport);
  glViewport(0, 0, static_cast<GLsizei>(width), static_cast<GLsizei>(height));
  glBindFramebuffer(GL_FRAMEBUFFER, id);
  const GLenum attachment = GL_COLOR_ATTACHMENT0 + index;
  if (colorAttachments.count(attachment) != 0) {
    glDrawBuffers(1, &attachment);
  } else {
    glDrawBuffer(GL_NONE);
  }
}

void FrameBuffer::unbind() {
  glViewport(savedViewport[0], savedViewport[1], savedViewport[2], savedViewport[3]);
  glBindFramebuffer(GL_FRAMEBUFFER, 0);
  // A surfaceless context has no back buffer; the resulting GL error is harmless and never read.
  glDrawBuffer(GL_BACK);
}

Shader::Shader(std::string name, GLenum stage) : name(std::move(name)), stage(stage) {}

Shader::~Shader() {
  if (glIsShader(id)) glDeleteShader(id);
  id = 0;
}

bool Shader::compile(const char* source, bool verbose, std::ostream& out) {
  if (id != 0 && glIsShader(id)) {
    glDeleteShader(id);
    id = 0;
  }
  if (source == nullptr) {
    if (verbose) out << "No source provided to compile shader " << name << std::endl;
    return false;
  }
  id = glCreateShader(stage);
  if (id == 0) {
    if (verbose) out << "Unable to create shader " << name << std::endl;
    return false;
  }
  glShaderSource(id, 1, &source, nullptr);
  glCompileShader(id);
  // Printed whatever the outcome: a successful compile may still carry warnings.
  if (verbose) printInfoLog(out);
  GLint status = 0;
  glGetShaderiv(id, GL_COMPILE_STATUS, &status);
  if (status == GL_TRUE) return true;
  if (glIsShader(id)) glDeleteShader(id);
  id = 0;
  return false;
}

void Shader::printInfoLog(std::ostream& out) const {
  writeInfoLog(
      out, "Shader", name, [this](GLint* length) { glGetShaderiv(id, GL_INFO_LOG_LENGTH, length); },
      [this](GLint length, GLchar* log) { glGetShaderInfoLog(id, length, nullptr, log); });
}

ShaderProgram::ShaderProgram(std::string name, std::vector<Shader*> shaders)
    : name(std::move(name)), shaders(std::move(shaders)) {}

ShaderProgram::~ShaderProgram() { release(); }

bool ShaderProgram::link(bool verbose, std::ostream& out) {
  if (id != 0) release();
  if (shaders.empty()) {
    if (verbose) out << "No shaders specified for shader program " << name << std::endl;
    return false;
  }
  id = glCreateProgram();
  if (id == 0) {
    if (verbose) out << "Unable to create shader program " << name << std::endl;
    return false;
  }
  for (const Shader* shader : shaders) glAttachShader(id, shader->id);
  glLinkProgram(id);
  if (verbose) printInfoLog(out);
  GLint status = 0;
  glGetProgramiv(id, GL_LINK_STATUS, &status);
  if (status == GL_TRUE) return true;
  release();
  return false;
}

void ShaderProgram::printInfoLog(std::ostream& out) const {
  writeInfoLog(
      out, "ShaderProgram", name, [this](GLint* length) { glGetProgramiv(id, GL_INFO_LOG_LENGTH, length); },
      [this](GLint length, GLchar* log) { glGetProgramInfoLog(id, length, nullptr, log); });
}

void ShaderProgram::release() {
  if (!glIsProgram(id)) return;
  for (const Shader* shader : shaders) glDetachShader(id, shader->id);
  shaders.clear();
  glDeleteProgram(id);
  id = 0;
}

ShaderLibrary::~ShaderLibrary() {
  // Programs still hold their shaders' ids for detaching, so they go first.
  programs.clear();
  shaders.clear();
}

bool ShaderLibrary::createShader(const std::string& name, GLenum stage, const char* source) {
  if (name.empty() || shaders.count(name) != 0) return false;
  auto shader = std::make_unique<Shader>(name, stage);
  if (!shader->compile(source, true, std::cerr)) return false;
  shaders.emplace(name, std::move(shader));
  return true;
}

bool ShaderLibrary::createProgram(const std::string& name, const std::vector<std::string>& shaderNames) {
  if (name.empty() || programs.count(name) != 0) return false;
  std::vector<Shader*> found;
  for (const std::string& shaderName : shaderNames) {
    const auto it = shaders.find(shaderName);
    if (it != shaders.end()) found.push_back(it->second.get());
  }
  auto program = std::make_unique<ShaderProgram>(name, std::move(found));
  if (!program->link(true, std::cerr)) return false;
  programs.emplace(name, std::move(program));
  return true;
}

ShaderProgram* ShaderLibrary::getProgram(const std::string& name) const {
  const auto it = programs.find(name);
  return it == programs.end() ? nullptr : it->second.get();
}

}  // namespace TessikSDK::GeomBind::Gpu
