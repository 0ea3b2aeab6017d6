#include "progress_bridge.h"

#include <algorithm>
#include <exception>
#include <utility>

namespace tessik::python {

namespace py = pybind11;

namespace {

// The library's titles read "Voxelizing model ... "; a callable wants just "Voxelizing model".
std::string stageName(const char* title) {
  std::string name = title != nullptr ? title : "";
  const auto last = name.find_last_not_of(" .");
  name.erase(last == std::string::npos ? 0 : last + 1);
  return name;
}

}  // namespace

ProgressBridge::ProgressBridge(py::object callback)
    : callback_(std::move(callback)), caller_(std::this_thread::get_id()) {}

ProgressBridge::~ProgressBridge() = default;

void ProgressBridge::begin(const char* title, int total, int start) {
  if (std::this_thread::get_id() != caller_) return;
  stage_ = stageName(title);
  setRange(total, start);
  poll(true, 0.0, true);
}

void ProgressBridge::end() { poll(true, 1.0, true); }

void ProgressBridge::setRange(int total, int start) {
  total_ = total;
  start_ = start;
}

bool ProgressBridge::update(int value) {
  poll(true, fractionOf(value), false);
  return false;
}

bool ProgressBridge::isCanceled() {
  poll(false, 0.0, false);
  return canceled_;
}

double ProgressBridge::fractionOf(int value) const {
  const int total = total_;
  const int start = start_;
  if (total <= start) return 0.0;
  return std::clamp(static_cast<double>(value - start) / static_cast<double>(total - start), 0.0, 1.0);
}

void ProgressBridge::poll(bool report, double fraction, bool force) {
  if (canceled_ || std::this_thread::get_id() != caller_) return;
  const auto now = std::chrono::steady_clock::now();
  if (!force && now - lastPoll_ < kPollInterval) return;
  lastPoll_ = now;

  py::gil_scoped_acquire gil;
  // Nothing may escape into the library, which may be inside an OpenMP region: every failure becomes
  // the saved Python exception plus cancellation.
  try {
    if (PyErr_CheckSignals() != 0) throw py::error_already_set();
    if (report && !callback_.is_none()) callback_(stage_, fraction);
    return;
  } catch (py::error_already_set& e) {
    error_.emplace(std::move(e));
  } catch (const std::exception& e) {
    PyErr_SetString(PyExc_RuntimeError, e.what());
    error_.emplace();
  } catch (...) {
    PyErr_SetString(PyExc_RuntimeError, "unknown C++ exception in the progress callable");
    error_.emplace();
  }
  canceled_ = true;
}

void ProgressBridge::rethrowIfCanceled() {
  if (error_.has_value()) {
    py::error_already_set error = std::move(*error_);
    error_.reset();
    throw error;
  }
}

}  // namespace tessik::python
