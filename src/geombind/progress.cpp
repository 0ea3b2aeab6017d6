#include "geombind/progress.h"

#include <atomic>
#include <iostream>
#include <utility>

namespace TessikSDK::GeomBind {

namespace {
std::atomic<bool> g_consoleReports{true};
}  // namespace

void setConsoleReports(bool enabled) { g_consoleReports = enabled; }
bool consoleReports() { return g_consoleReports; }

IProgress::~IProgress() = default;

NullProgress::~NullProgress() = default;
void NullProgress::begin(const char*, int, int) {}
void NullProgress::end() {}
void NullProgress::setRange(int, int) {}
bool NullProgress::update(int) { return false; }
bool NullProgress::isCanceled() { return false; }

ProgressImpl::ProgressImpl(std::string name) : taskName(std::move(name)) {}

ProgressImpl::~ProgressImpl() = default;

void ProgressImpl::begin(const char* title, int total, int start) {
  taskName = title != nullptr ? title : "";
  if (consoleReports()) std::cout << "Starting " << taskName << " ... ";
  setRange(total, start);
}

void ProgressImpl::end() {
  if (consoleReports()) std::cout << "done " << std::endl;
}

void ProgressImpl::setRange(int, int) {}

bool ProgressImpl::update(int) { return false; }

bool ProgressImpl::isCanceled() { return false; }

}  // namespace TessikSDK::GeomBind
