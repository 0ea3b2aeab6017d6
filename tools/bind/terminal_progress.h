#pragma once

#include <atomic>
#include <chrono>
#include <cstdio>
#include <mutex>
#include <string>

#include <tessik/geombind.h>

namespace tessik::bind {

// The binding's progress on a terminal: a redrawn bar when `stream` is a terminal, one line per phase
// otherwise (logs, pipes). Cancellation is read from `cancel`, which a signal handler may set.
class TerminalProgress final : public TessikSDK::GeomBind::IProgress {
 public:
  TerminalProgress(std::FILE* stream, const std::atomic<bool>* cancel);
  TerminalProgress(std::FILE* stream, const std::atomic<bool>* cancel, bool interactive);

  void begin(const char* title, int total, int start) override;
  void end() override;
  void setRange(int total, int start) override;
  bool update(int value) override;
  bool isCanceled() override;

 private:
  void drawLocked(int value);

  using Clock = std::chrono::steady_clock;
  std::FILE* stream_;
  const std::atomic<bool>* cancel_;
  bool interactive_;
  std::mutex mutex_;  // update() arrives from worker threads
  std::string title_;
  int total_ = 0;
  int start_ = 0;
  int lastPercent_ = -1;
  Clock::time_point began_;
  bool open_ = false;
};

}  // namespace tessik::bind
