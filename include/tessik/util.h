#pragma once

#include <cstddef>
#include <exception>
#include <new>
#include <string>

#include <tessik/export.h>

/// Host utility layer: the allocator, the exceptions and the heap operators that the skin engine's
/// records and objects go through. A host that embeds the engine sees these types in the engine's
/// signatures and may catch the exceptions.
namespace TessikSDK::Util {

/// Base of every exception the skin engine throws. The message is a wide-character string, as the
/// engine's host expects; what() gives the same text narrowed to ASCII for std::exception handlers.
class TESSIK_API Exception : public std::exception {
 public:
  explicit Exception(const wchar_t* message);
  ~Exception() override;
  Exception(const Exception&);
  Exception& operator=(const Exception&);

  /// The message as given at construction; valid while the exception lives.
  const wchar_t* Message() const noexcept;
  const char* what() const noexcept override;

 private:
  std::wstring message_;
  std::string narrow_;
};

/// An index outside an array's used length.
class TESSIK_API OutOfRangeException : public Exception {
 public:
  explicit OutOfRangeException(const wchar_t* message);
  ~OutOfRangeException() override;
};

/// The host allocator returned no storage.
class TESSIK_API OutOfMemoryException : public Exception {
 public:
  explicit OutOfMemoryException(const wchar_t* message);
  ~OutOfMemoryException() override;
};

/// The message every out-of-range index carries.
TESSIK_API extern const wchar_t* const kArrayIndexOutOfBoundsMessage;

/// Storage of `size` bytes, or null when none can be had. Release with UtilDeallocateMemory.
TESSIK_API void* UtilAllocateMemory(std::size_t size) noexcept;
/// Releases storage from UtilAllocateMemory; null is ignored.
TESSIK_API void UtilDeallocateMemory(void* memory) noexcept;
/// Throws OutOfMemoryException. Called where an allocation the engine cannot do without failed.
[[noreturn]] TESSIK_API void UtilOutOfMemoryException();
/// Throws OutOfRangeException with kArrayIndexOutOfBoundsMessage.
[[noreturn]] TESSIK_API void ThrowIndexOutOfRange();

/// Routes a class's operator new and delete through UtilAllocateMemory/UtilDeallocateMemory, so the
/// host allocator serves every object of a derived class. A failed allocation throws std::bad_alloc.
class TESSIK_API TessikHeapOperators {
 public:
  static void* operator new(std::size_t size);
  static void* operator new[](std::size_t size);
  static void operator delete(void* memory) noexcept;
  static void operator delete[](void* memory) noexcept;
};

}  // namespace TessikSDK::Util
