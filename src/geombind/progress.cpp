#include "geombind/progress.h"

#include <iostream>
#include <utility>

namespace TessikSDK::GeomBind {

IProgress::~IProgress() = default;

ProgressImpl::ProgressImpl(std::string name) : taskName(std::move(name)) {}

ProgressImpl::~ProgressImpl() = default;

void ProgressImpl::begin(const char* title, int total, int start) {
  taskName = title != nullptr ? title : "";
  std::cout << "Starting " << taskName << " ... ";
  setRange(total, start);
}

void ProgressImpl::end() { std::cout << "done " << std::endl; }

void ProgressImpl::setRange(int, int) {}

bool ProgressImpl::update(int) { return false; }

bool ProgressImpl::isCanceled() { return false; }

}  // namespace TessikSDK::GeomBind
