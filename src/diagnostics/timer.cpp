#include "diagnostics/timer.h"

namespace TessikSDK::Diagnostics {

namespace {

constexpr double kScalePerMicrosecond[] = {1e-06, 0.001, 1.0};
constexpr int kUnitCount = static_cast<int>(sizeof(kScalePerMicrosecond) / sizeof(kScalePerMicrosecond[0]));

double totalMicroseconds(const TimeVal& tv) { return tv.seconds * 1e6 + tv.microseconds; }

}  // namespace

Timer::Timer() : start_(std::make_unique<TimeVal>(TimeVal{0, 0})) { restart(); }

Timer::Timer(const Timer& other) : start_(std::make_unique<TimeVal>(*other.start_)) {}

Timer& Timer::operator=(const Timer& other) {
  *start_ = *other.start_;
  return *this;
}

Timer::~Timer() = default;

// A failed read leaves the start as it was: a stale start overstates the time, which beats a garbage one.
void Timer::restart() { getTimeOfDay(start_.get()); }

double Timer::elapsed(int unit) const {
  if (unit < 0 || unit >= kUnitCount) return 0.0;
  TimeVal now = *start_;
  getTimeOfDay(&now);
  return (totalMicroseconds(now) - totalMicroseconds(*start_)) * kScalePerMicrosecond[unit];
}

}  // namespace TessikSDK::Diagnostics
