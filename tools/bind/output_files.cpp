#include "output_files.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <stdexcept>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tessik::bind {
namespace {

mode_t processUmask() {
  const mode_t mask = umask(0);
  umask(mask);
  return mask;
}

}  // namespace

void writeFileChecked(const std::string& path, const void* data, std::size_t size) {
  std::FILE* file = std::fopen(path.c_str(), "wb");
  if (file == nullptr)
    throw std::runtime_error("cannot open '" + path + "' for writing: " + std::strerror(errno));
  errno = 0;
  const bool written = std::fwrite(data, 1, size, file) == size && std::fflush(file) == 0;
  const int writeError = errno;
  const bool closed = std::fclose(file) == 0;
  if (written && closed) return;
  const std::string why = std::strerror(writeError != 0 ? writeError : errno);
  std::error_code ignored;  // a device such as /dev/full is not ours to remove
  if (std::filesystem::is_regular_file(path, ignored)) std::filesystem::remove(path, ignored);
  throw std::runtime_error("cannot write '" + path + "': " + why);
}

PendingOutputs::~PendingOutputs() { discard(); }

std::string PendingOutputs::stage(const std::string& destination) {
  namespace fs = std::filesystem;
  const fs::path dest(destination);
  std::error_code ec;
  if (fs::is_directory(dest, ec))
    throw std::runtime_error("cannot write '" + destination + "': it is a directory");
  // A device, a FIFO or a socket is never replaced by a file.
  if (fs::exists(dest, ec) && !fs::is_regular_file(dest, ec))
    throw std::runtime_error("cannot write '" + destination + "': it is not a regular file");
  const fs::path folder = dest.parent_path().empty() ? fs::path(".") : dest.parent_path();
  const std::string ext = dest.extension().string();
  std::string pattern = (folder / ("." + dest.stem().string() + ".tmp-XXXXXX" + ext)).string();
  const int fd = mkstemps(pattern.data(), static_cast<int>(ext.size()));
  if (fd < 0) throw std::runtime_error("cannot write '" + destination + "': " + std::strerror(errno));
  // mkstemps makes the file private; the result should get the permissions any new file would.
  fchmod(fd, 0666 & ~processUmask());
  close(fd);
  entries_.push_back({pattern, destination});
  return pattern;
}

void PendingOutputs::commit() {
  // Every file reaches the disk before any takes its place: a crash between the renames leaves old or
  // complete files, never a truncated one under the final name.
  for (const Entry& e : entries_) {
    const int fd = open(e.temporary.c_str(), O_RDONLY);
    const bool synced = fd >= 0 && fsync(fd) == 0;
    const std::string why = std::strerror(errno);
    if (fd >= 0) close(fd);
    if (!synced) {
      const std::string destination = e.destination;
      discard();
      throw std::runtime_error("cannot write '" + destination + "': " + why);
    }
  }
  while (!entries_.empty()) {
    const Entry e = entries_.front();
    if (std::rename(e.temporary.c_str(), e.destination.c_str()) != 0) {
      const std::string why = std::strerror(errno);
      discard();
      throw std::runtime_error("cannot write '" + e.destination + "': " + why);
    }
    entries_.erase(entries_.begin());
  }
}

void PendingOutputs::discard() noexcept {
  for (const Entry& e : entries_) std::remove(e.temporary.c_str());
  entries_.clear();
}

}  // namespace tessik::bind
