#include "tessik/util.h"

#include <cstdlib>
#include <new>

namespace TessikSDK::Util {

namespace {

// Messages are ASCII by contract; anything wider degrades to '?' rather than being truncated.
std::string narrowed(const std::wstring& wide) {
  std::string out;
  out.reserve(wide.size());
  for (wchar_t c : wide) out.push_back(c >= 0 && c < 0x80 ? static_cast<char>(c) : '?');
  return out;
}

}  // namespace

const wchar_t* const kArrayIndexOutOfBoundsMessage =
    L"Argument index out of bounds, passed into a TessikSDK::Array::operator[]";

Exception::Exception(const wchar_t* message)
    : message_(message != nullptr ? message : L""), narrow_(narrowed(message_)) {}
Exception::~Exception() = default;
Exception::Exception(const Exception&) = default;
Exception& Exception::operator=(const Exception&) = default;
const wchar_t* Exception::Message() const noexcept { return message_.c_str(); }
const char* Exception::what() const noexcept { return narrow_.c_str(); }

OutOfRangeException::OutOfRangeException(const wchar_t* message) : Exception(message) {}
OutOfRangeException::~OutOfRangeException() = default;

OutOfMemoryException::OutOfMemoryException(const wchar_t* message) : Exception(message) {}
OutOfMemoryException::~OutOfMemoryException() = default;

void* UtilAllocateMemory(std::size_t size) noexcept { return std::malloc(size); }
void UtilDeallocateMemory(void* memory) noexcept { std::free(memory); }

void UtilOutOfMemoryException() { throw OutOfMemoryException(L"Out of memory"); }
void ThrowIndexOutOfRange() { throw OutOfRangeException(kArrayIndexOutOfBoundsMessage); }

void* TessikHeapOperators::operator new(std::size_t size) {
  // malloc(0) may return null legitimately; one byte keeps every object's address distinct.
  void* memory = UtilAllocateMemory(size == 0 ? 1 : size);
  if (memory == nullptr) throw std::bad_alloc();
  return memory;
}
void* TessikHeapOperators::operator new[](std::size_t size) { return operator new(size); }
void TessikHeapOperators::operator delete(void* memory) noexcept { UtilDeallocateMemory(memory); }
void TessikHeapOperators::operator delete[](void* memory) noexcept { UtilDeallocateMemory(memory); }

}  // namespace TessikSDK::Util
