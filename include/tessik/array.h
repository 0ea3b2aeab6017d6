#pragma once

#include <cstdint>
#include <cstring>
#include <type_traits>

#include <tessik/util.h>

namespace TessikSDK {

/// The default storage policy of Array: the host allocator of the utility layer.
struct UtilAllocator {
  static void* Allocate(std::size_t bytes) noexcept { return Util::UtilAllocateMemory(bytes); }
  static void Deallocate(void* memory) noexcept { Util::UtilDeallocateMemory(memory); }
};

/// A bounds-checked growable array of plain records, as the skin engine stores its bones and points.
///
/// Records are copied bytewise, so T must be trivially copyable. Storage grows by at least
/// `growLength` records (8) or by half the requested length, whichever is more; shrinking only lowers
/// the used length and keeps the storage. `Allocator` provides static Allocate/Deallocate (tests swap
/// in one that fails on demand).
template <class T, class Allocator = UtilAllocator>
class Array {
  static_assert(std::is_trivially_copyable_v<T>, "Array moves its records bytewise");

 public:
  Array() = default;
  ~Array() {
    usedLength = 0;
    Allocator::Deallocate(storage);
  }
  Array(const Array&) = delete;
  Array& operator=(const Array&) = delete;

  std::uint64_t ReservedLength() const { return reservedLength; }
  std::uint64_t UsedLength() const { return usedLength; }
  std::uint64_t GrowLength() const { return growLength; }

  /// @throws Util::OutOfRangeException when `index` is negative or not below UsedLength().
  T& operator[](int index) { return storage[CheckedIndex(index)]; }
  const T& operator[](int index) const { return storage[CheckedIndex(index)]; }

  /// Makes the array hold `length` records. Records below both the old and the new length are kept;
  /// every record from the old used length up to `length - 1` becomes a copy of `fill`.
  /// @throws Util::OutOfMemoryException when growing needs storage the allocator cannot give; the
  ///         array is then unchanged.
  void SetLength(std::uint64_t length, const T& fill) {
    if (length > reservedLength) {
      const std::uint64_t reserve = growLength > length / 2 ? length + growLength : length + length / 2;
      T* grown = static_cast<T*>(Allocator::Allocate(static_cast<std::size_t>(reserve * sizeof(T))));
      if (grown == nullptr) Util::UtilOutOfMemoryException();
      if (usedLength > 0) std::memcpy(grown, storage, static_cast<std::size_t>(usedLength * sizeof(T)));
      Allocator::Deallocate(storage);
      storage = grown;
      reservedLength = reserve;
    }
    for (std::uint64_t i = usedLength; i < length; ++i) std::memcpy(&storage[i], &fill, sizeof(T));
    usedLength = length;
  }

 private:
  std::uint64_t CheckedIndex(int index) const {
    const std::int64_t wide = index;
    if (wide < 0 || static_cast<std::uint64_t>(wide) >= usedLength) Util::ThrowIndexOutOfRange();
    return static_cast<std::uint64_t>(wide);
  }

  T* storage = nullptr;
  std::uint64_t reservedLength = 0;
  std::uint64_t usedLength = 0;
  std::uint64_t growLength = 8;
};

}  // namespace TessikSDK
