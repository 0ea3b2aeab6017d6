#pragma once

#include <atomic>
#include <ostream>
#include <string>
#include <vector>

#include <tessik/geombind.h>

#include "binding.h"
#include "pose.h"

namespace tessik::bind {

struct ToolOptions {
  std::string input;         // empty: the built-in character, written to out/character.glb and .png
  std::string skeletonPath;  // JSON bones for a file without a skeleton (replaces the file's own)
  std::string outputPath;    // .glb or .gltf
  std::string csvPath;
  std::string previewPath;  // .png
  int previewSize = 800;
  BindSettings settings;
  std::vector<JointRotation> pose;  // applied before the preview is drawn
};

// Exit statuses of the tool.
enum ExitStatus : int { kExitOk = 0, kExitFailed = 1, kExitUsage = 2, kExitCancelled = 130 };

// Where the built-in character's files go when no input is named.
inline constexpr const char* kDefaultOutput = "out/character.glb";
inline constexpr const char* kDefaultPreview = "out/character.png";
// The built-in run bends the left elbow so that its picture shows how the binding deforms.
std::vector<JointRotation> defaultCharacterPose();

// Checks what option parsing cannot: extensions, the binding options' ranges (the library's own limits),
// and that there is something to write. Answers the first fault as one line, or an empty string.
std::string validateOptions(const ToolOptions& options);

// One whole run: read, bind (through the library's binding pipeline), write, draw, summarise. Uses the OpenGL
// context current on this thread, or makes a headless one. Progress and cancellation go through `progress`;
// `cancel`, when set, is checked once more before the files are put in place (a signal may arrive after the
// binding). The summary goes to `out`, a failure to `err` as one line. Answers an ExitStatus; nothing is
// written unless it is kExitOk.
int runBindTool(const ToolOptions& options,
                TessikSDK::GeomBind::IProgress& progress,
                const std::atomic<bool>* cancel,
                std::ostream& out,
                std::ostream& err);

}  // namespace tessik::bind
