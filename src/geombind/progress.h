#pragma once

#include <string>

#include "tessik/geombind.h"

namespace TessikSDK::GeomBind {

/// The progress object a binding uses when the host gives none: one console line per phase, never
/// cancels.
class ProgressImpl : public IProgress {
 public:
  explicit ProgressImpl(std::string taskName = std::string());
  ~ProgressImpl() override;

  void begin(const char* title, int total, int start) override;
  void end() override;
  void setRange(int total, int start) override;
  bool update(int value) override;
  /// Always false: a host that binds without its own progress object gets its weights.
  bool isCanceled() override;

  std::string taskName;
};

}  // namespace TessikSDK::GeomBind
