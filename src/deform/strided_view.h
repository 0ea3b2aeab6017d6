#pragma once

#include <cstdint>
#include <cstring>

namespace TessikSDK::Corvane {

// Host arrays may interleave other data and be unaligned: elements are memcpy'd, never dereferenced
// through a cast pointer.
template <class T>
T loadUnaligned(const unsigned char* at) {
  T value;
  std::memcpy(&value, at, sizeof(T));
  return value;
}

// A read-only view of a caller's strided stream. The byte offset of element j is j * stride taken as
// a 32-bit unsigned product, so the same stream means the same bytes whatever the width of long.
template <class T>
struct StridedView {
  const unsigned char* base = nullptr;
  std::uint32_t stride = 0;

  StridedView(const void* pointer, std::uint32_t byteStride)
      : base(static_cast<const unsigned char*>(pointer)), stride(byteStride) {}

  const unsigned char* at(int j) const {
    return base + static_cast<std::uint32_t>(static_cast<std::uint32_t>(j) * stride);
  }
  T operator[](int j) const { return loadUnaligned<T>(at(j)); }
};

}  // namespace TessikSDK::Corvane
