#include "terminal_progress.h"

#include <algorithm>

#include <unistd.h>

namespace tessik::bind {

TerminalProgress::TerminalProgress(std::FILE* stream, const std::atomic<bool>* cancel)
    : TerminalProgress(stream, cancel, isatty(fileno(stream)) != 0) {}

TerminalProgress::TerminalProgress(std::FILE* stream, const std::atomic<bool>* cancel, bool interactive)
    : stream_(stream), cancel_(cancel), interactive_(interactive) {}

void TerminalProgress::begin(const char* title, int total, int start) {
  std::lock_guard<std::mutex> lock(mutex_);
  title_ = title != nullptr ? title : "";
  total_ = total;
  start_ = start;
  lastPercent_ = -1;
  began_ = Clock::now();
  open_ = true;
  if (interactive_) {
    drawLocked(start);
  } else {
    // The library's titles already end in an ellipsis; a host's may not.
    const bool ellipsis = title_.size() >= 3 && title_.compare(title_.size() - 3, 3, "...") == 0;
    std::fprintf(stream_, "%s%s\n", title_.c_str(), ellipsis ? "" : " ...");
    std::fflush(stream_);
  }
}

void TerminalProgress::end() {
  std::lock_guard<std::mutex> lock(mutex_);
  if (!open_) return;
  open_ = false;
  const double seconds = std::chrono::duration<double>(Clock::now() - began_).count();
  // The bar's line is overwritten by the phase's final line.
  std::fprintf(stream_, "%s%-40s %8.2f s\n", interactive_ ? "\r\033[K" : "", title_.c_str(), seconds);
  std::fflush(stream_);
}

void TerminalProgress::setRange(int total, int start) {
  std::lock_guard<std::mutex> lock(mutex_);
  total_ = total;
  start_ = start;
  lastPercent_ = -1;
}

bool TerminalProgress::update(int value) {
  if (!interactive_) return true;
  // A worker that finds the bar busy skips its redraw rather than waiting: the next update redraws.
  std::unique_lock<std::mutex> lock(mutex_, std::try_to_lock);
  if (lock.owns_lock() && open_) drawLocked(value);
  return true;
}

bool TerminalProgress::isCanceled() { return cancel_ != nullptr && cancel_->load(std::memory_order_relaxed); }

void TerminalProgress::drawLocked(int value) {
  const int span = total_ - start_;
  const int percent = span > 0 ? std::clamp(100 * (value - start_) / span, 0, 100) : 0;
  if (percent == lastPercent_) return;
  lastPercent_ = percent;
  constexpr int kWidth = 30;
  const int filled = percent * kWidth / 100;
  std::fprintf(stream_, "\r\033[K%-40s [%.*s%*s] %3d%%", title_.c_str(), filled,
               "##############################", kWidth - filled, "", percent);
  std::fflush(stream_);
}

}  // namespace tessik::bind
