#pragma once

// OpenGL without linking it: GLEW's header supplies the types, enums and entry-point signatures, and the
// calls below go through a table filled at run time from whichever GL library the process has. Nothing
// of GLEW, libGL, libOpenGL or libEGL is linked, so a program that never draws never needs them
// installed. Include this header instead of <GL/glew.h>, and only in source files: it redirects the gl*
// names for everything included after it.

// clang-format off
#include <GL/glew.h>
#undef glGetStringi
#define glGetStringi (::TessikSDK::GL::api().GetStringi)
// clang-format on

#include <string>

namespace TessikSDK::GL {

struct Functions {
#define TESSIK_GL_CORE(name) decltype(&::gl##name) name = nullptr;
#define TESSIK_GL_EXT(name) decltype(::__glew##name) name = nullptr;
#include "gl/gl_functions.inc"
#undef TESSIK_GL_CORE
#undef TESSIK_GL_EXT
};

/// The process's entry points, loaded on first use. Like the driver's own dispatch, the same pointers
/// serve every context and thread. All null when load fails: check load before the first call.
const Functions& api();

/// Opens the system's GL library and fills the table, once per process; later calls answer the first
/// one's result. False, with the reason in `why`, when no GL library can be opened or it lacks an
/// OpenGL 1.1 entry point; newer entry points a driver does not offer stay null.
bool load(std::string* why = nullptr);

/// Whether the context current on this thread reports at least this version; false without one.
bool versionAtLeast(int major, int minor);

/// Whether the process already has a GL library loaded (the host's, or ours from an earlier load): only
/// then can a context be current. Loads nothing.
bool libraryInProcess();

/// Whether the context current on this thread renders in software (Mesa's llvmpipe, softpipe or swrast);
/// false without a context.
bool softwareRenderer();

/// Whether the current context lists the extension (whole name, e.g. "GL_ARB_framebuffer_object").
bool hasExtension(const char* name);

}  // namespace TessikSDK::GL

// clang-format off
#define glBegin (::TessikSDK::GL::api().Begin)
#define glBindTexture (::TessikSDK::GL::api().BindTexture)
#define glClear (::TessikSDK::GL::api().Clear)
#define glClearColor (::TessikSDK::GL::api().ClearColor)
#define glClearDepth (::TessikSDK::GL::api().ClearDepth)
#define glColor3f (::TessikSDK::GL::api().Color3f)
#define glColorMask (::TessikSDK::GL::api().ColorMask)
#define glColorPointer (::TessikSDK::GL::api().ColorPointer)
#define glCullFace (::TessikSDK::GL::api().CullFace)
#define glDeleteTextures (::TessikSDK::GL::api().DeleteTextures)
#define glDepthFunc (::TessikSDK::GL::api().DepthFunc)
#define glDepthMask (::TessikSDK::GL::api().DepthMask)
#define glDisable (::TessikSDK::GL::api().Disable)
#define glDisableClientState (::TessikSDK::GL::api().DisableClientState)
#define glDrawBuffer (::TessikSDK::GL::api().DrawBuffer)
#define glDrawElements (::TessikSDK::GL::api().DrawElements)
#define glEnable (::TessikSDK::GL::api().Enable)
#define glEnableClientState (::TessikSDK::GL::api().EnableClientState)
#define glEnd (::TessikSDK::GL::api().End)
#define glFinish (::TessikSDK::GL::api().Finish)
#define glGenTextures (::TessikSDK::GL::api().GenTextures)
#define glGetError (::TessikSDK::GL::api().GetError)
#define glGetFloatv (::TessikSDK::GL::api().GetFloatv)
#define glGetIntegerv (::TessikSDK::GL::api().GetIntegerv)
#define glGetString (::TessikSDK::GL::api().GetString)
#define glGetTexImage (::TessikSDK::GL::api().GetTexImage)
#define glGetTexParameteriv (::TessikSDK::GL::api().GetTexParameteriv)
#define glIsEnabled (::TessikSDK::GL::api().IsEnabled)
#define glIsTexture (::TessikSDK::GL::api().IsTexture)
#define glLoadIdentity (::TessikSDK::GL::api().LoadIdentity)
#define glMatrixMode (::TessikSDK::GL::api().MatrixMode)
#define glOrtho (::TessikSDK::GL::api().Ortho)
#define glPixelStorei (::TessikSDK::GL::api().PixelStorei)
#define glPolygonMode (::TessikSDK::GL::api().PolygonMode)
#define glPopAttrib (::TessikSDK::GL::api().PopAttrib)
#define glPopClientAttrib (::TessikSDK::GL::api().PopClientAttrib)
#define glPopMatrix (::TessikSDK::GL::api().PopMatrix)
#define glPushAttrib (::TessikSDK::GL::api().PushAttrib)
#define glPushClientAttrib (::TessikSDK::GL::api().PushClientAttrib)
#define glPushMatrix (::TessikSDK::GL::api().PushMatrix)
#define glReadBuffer (::TessikSDK::GL::api().ReadBuffer)
#define glReadPixels (::TessikSDK::GL::api().ReadPixels)
#define glShadeModel (::TessikSDK::GL::api().ShadeModel)
#define glTexCoord2i (::TessikSDK::GL::api().TexCoord2i)
#define glTexImage2D (::TessikSDK::GL::api().TexImage2D)
#define glTexParameteri (::TessikSDK::GL::api().TexParameteri)
#define glVertex2i (::TessikSDK::GL::api().Vertex2i)
#define glVertex3d (::TessikSDK::GL::api().Vertex3d)
#define glVertexPointer (::TessikSDK::GL::api().VertexPointer)
#define glViewport (::TessikSDK::GL::api().Viewport)
#undef glActiveTexture
#define glActiveTexture (::TessikSDK::GL::api().ActiveTexture)
#undef glAttachShader
#define glAttachShader (::TessikSDK::GL::api().AttachShader)
#undef glBindBuffer
#define glBindBuffer (::TessikSDK::GL::api().BindBuffer)
#undef glBindFramebuffer
#define glBindFramebuffer (::TessikSDK::GL::api().BindFramebuffer)
#undef glBindFramebufferEXT
#define glBindFramebufferEXT (::TessikSDK::GL::api().BindFramebufferEXT)
#undef glBindRenderbuffer
#define glBindRenderbuffer (::TessikSDK::GL::api().BindRenderbuffer)
#undef glBindRenderbufferEXT
#define glBindRenderbufferEXT (::TessikSDK::GL::api().BindRenderbufferEXT)
#undef glBindVertexArray
#define glBindVertexArray (::TessikSDK::GL::api().BindVertexArray)
#undef glBufferData
#define glBufferData (::TessikSDK::GL::api().BufferData)
#undef glCheckFramebufferStatus
#define glCheckFramebufferStatus (::TessikSDK::GL::api().CheckFramebufferStatus)
#undef glCheckFramebufferStatusEXT
#define glCheckFramebufferStatusEXT (::TessikSDK::GL::api().CheckFramebufferStatusEXT)
#undef glCompileShader
#define glCompileShader (::TessikSDK::GL::api().CompileShader)
#undef glCreateProgram
#define glCreateProgram (::TessikSDK::GL::api().CreateProgram)
#undef glCreateShader
#define glCreateShader (::TessikSDK::GL::api().CreateShader)
#undef glDeleteBuffers
#define glDeleteBuffers (::TessikSDK::GL::api().DeleteBuffers)
#undef glDeleteFramebuffers
#define glDeleteFramebuffers (::TessikSDK::GL::api().DeleteFramebuffers)
#undef glDeleteFramebuffersEXT
#define glDeleteFramebuffersEXT (::TessikSDK::GL::api().DeleteFramebuffersEXT)
#undef glDeleteProgram
#define glDeleteProgram (::TessikSDK::GL::api().DeleteProgram)
#undef glDeleteRenderbuffers
#define glDeleteRenderbuffers (::TessikSDK::GL::api().DeleteRenderbuffers)
#undef glDeleteRenderbuffersEXT
#define glDeleteRenderbuffersEXT (::TessikSDK::GL::api().DeleteRenderbuffersEXT)
#undef glDeleteShader
#define glDeleteShader (::TessikSDK::GL::api().DeleteShader)
#undef glDetachShader
#define glDetachShader (::TessikSDK::GL::api().DetachShader)
#undef glDrawBuffers
#define glDrawBuffers (::TessikSDK::GL::api().DrawBuffers)
#undef glFramebufferRenderbuffer
#define glFramebufferRenderbuffer (::TessikSDK::GL::api().FramebufferRenderbuffer)
#undef glFramebufferRenderbufferEXT
#define glFramebufferRenderbufferEXT (::TessikSDK::GL::api().FramebufferRenderbufferEXT)
#undef glFramebufferTexture2D
#define glFramebufferTexture2D (::TessikSDK::GL::api().FramebufferTexture2D)
#undef glGenBuffers
#define glGenBuffers (::TessikSDK::GL::api().GenBuffers)
#undef glGenFramebuffers
#define glGenFramebuffers (::TessikSDK::GL::api().GenFramebuffers)
#undef glGenFramebuffersEXT
#define glGenFramebuffersEXT (::TessikSDK::GL::api().GenFramebuffersEXT)
#undef glGenRenderbuffers
#define glGenRenderbuffers (::TessikSDK::GL::api().GenRenderbuffers)
#undef glGenRenderbuffersEXT
#define glGenRenderbuffersEXT (::TessikSDK::GL::api().GenRenderbuffersEXT)
#undef glGetProgramInfoLog
#define glGetProgramInfoLog (::TessikSDK::GL::api().GetProgramInfoLog)
#undef glGetProgramiv
#define glGetProgramiv (::TessikSDK::GL::api().GetProgramiv)
#undef glGetShaderInfoLog
#define glGetShaderInfoLog (::TessikSDK::GL::api().GetShaderInfoLog)
#undef glGetShaderiv
#define glGetShaderiv (::TessikSDK::GL::api().GetShaderiv)
#undef glGetStringi
#define glGetStringi (::TessikSDK::GL::api().GetStringi)
#undef glGetUniformLocation
#define glGetUniformLocation (::TessikSDK::GL::api().GetUniformLocation)
#undef glIsFramebuffer
#define glIsFramebuffer (::TessikSDK::GL::api().IsFramebuffer)
#undef glIsProgram
#define glIsProgram (::TessikSDK::GL::api().IsProgram)
#undef glIsRenderbuffer
#define glIsRenderbuffer (::TessikSDK::GL::api().IsRenderbuffer)
#undef glIsShader
#define glIsShader (::TessikSDK::GL::api().IsShader)
#undef glLinkProgram
#define glLinkProgram (::TessikSDK::GL::api().LinkProgram)
#undef glRenderbufferStorage
#define glRenderbufferStorage (::TessikSDK::GL::api().RenderbufferStorage)
#undef glRenderbufferStorageEXT
#define glRenderbufferStorageEXT (::TessikSDK::GL::api().RenderbufferStorageEXT)
#undef glShaderSource
#define glShaderSource (::TessikSDK::GL::api().ShaderSource)
#undef glUniform1f
#define glUniform1f (::TessikSDK::GL::api().Uniform1f)
#undef glUniform1i
#define glUniform1i (::TessikSDK::GL::api().Uniform1i)
#undef glUniformMatrix4fv
#define glUniformMatrix4fv (::TessikSDK::GL::api().UniformMatrix4fv)
#undef glUseProgram
#define glUseProgram (::TessikSDK::GL::api().UseProgram)
// clang-format on
