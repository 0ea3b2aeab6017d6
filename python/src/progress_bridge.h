#pragma once

#include <atomic>
#include <chrono>
#include <optional>
#include <string>
#include <thread>

#include <pybind11/pybind11.h>

#include <tessik/geombind.h>

namespace tessik::python {

// Carries a binding's progress to a Python callable and Python's interruptions (Ctrl-C, an exception
// from the callable) back to the library as cancellation. Made and finished with the GIL held; the
// library calls it without the GIL, from the binding thread and from OpenMP workers.
//
// Only the binding thread ever runs Python, and at most every kPollInterval between phase changes, so
// a busy parallel loop never queues up on the GIL. Workers only read the cancel flag.
class ProgressBridge final : public TessikSDK::GeomBind::IProgress {
 public:
  // `callback` is None or callable(stage: str, fraction: float).
  explicit ProgressBridge(pybind11::object callback);
  ~ProgressBridge() override;
  ProgressBridge(const ProgressBridge&) = delete;
  ProgressBridge& operator=(const ProgressBridge&) = delete;

  void begin(const char* title, int total, int start) override;
  void end() override;
  void setRange(int total, int start) override;
  bool update(int value) override;
  bool isCanceled() override;

  // Whether Python asked the run to stop; safe on any thread.
  bool canceled() const { return canceled_; }
  // With the GIL held, once the library has returned: raises what stopped the run, if anything did.
  void rethrowIfCanceled();

  static constexpr std::chrono::milliseconds kPollInterval{50};

 private:
  // With `force` false, does nothing until kPollInterval has passed since the last visit to Python.
  void poll(bool report, double fraction, bool force);
  double fractionOf(int value) const;

  pybind11::object callback_;
  const std::thread::id caller_;
  std::atomic<bool> canceled_{false};
  std::atomic<int> total_{0};
  std::atomic<int> start_{0};
  // Touched only on the binding thread.
  std::string stage_;
  std::chrono::steady_clock::time_point lastPoll_{};
  std::optional<pybind11::error_already_set> error_;
};

}  // namespace tessik::python
