#pragma once

#include <cstddef>
#include <string>
#include <vector>

namespace tessik::bind {

// Writes `size` bytes to `path` (created or truncated), checking every write, the flush and the close: a
// full disk or a file-size limit must fail the run, not leave a truncated file behind a success. On
// failure removes what it wrote (a regular file only) and throws std::runtime_error naming the path and
// the reason.
void writeFileChecked(const std::string& path, const void* data, std::size_t size);

// The files of one run. Each is written under a temporary name beside its destination and renamed into
// place by commit(), so a failed or cancelled run leaves no half-written file and keeps whatever was
// there before. Temporaries not committed are removed on destruction.
class PendingOutputs {
 public:
  PendingOutputs() = default;
  PendingOutputs(const PendingOutputs&) = delete;
  PendingOutputs& operator=(const PendingOutputs&) = delete;
  ~PendingOutputs();

  // Creates an empty temporary file in the destination's folder, keeping its extension (writers pick
  // their format from it), and answers its path. Throws std::runtime_error when the folder cannot take it.
  std::string stage(const std::string& destination);
  // Renames every staged file onto its destination. Throws std::runtime_error naming the first that fails.
  void commit();
  // Removes every staged file that was not committed.
  void discard() noexcept;

 private:
  struct Entry {
    std::string temporary;
    std::string destination;
  };
  std::vector<Entry> entries_;
};

}  // namespace tessik::bind
