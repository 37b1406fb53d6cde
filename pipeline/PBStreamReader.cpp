#include "pipeline/PBStreamReader.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace kolvrand {

namespace {

class FileDescriptor {
 public:
  explicit FileDescriptor(int fd) : fd_(fd) {}
  ~FileDescriptor() {
    if (fd_ >= 0) ::close(fd_);
  }
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;
  int get() const { return fd_; }

 private:
  int fd_;
};

NSError errnoError(const std::string& path, const char* what, int err) {
  return {path + ": " + what + ": " + std::strerror(err)};
}

}  // namespace

std::optional<PBStreamReader::FileContents> PBStreamReader::readFileContents(
    const std::string& path, NSError* error) {
  auto fail = [&](NSError e) -> std::optional<FileContents> {
    if (error) *error = std::move(e);
    return std::nullopt;
  };
  // O_NONBLOCK: opening a FIFO must not wait for a writer; it is refused below.
  FileDescriptor fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  if (fd.get() < 0) return fail(errnoError(path, "cannot open", errno));
  struct stat st {};
  if (::fstat(fd.get(), &st) != 0) return fail(errnoError(path, "cannot stat", errno));
  if (!S_ISREG(st.st_mode)) return fail({path + ": not a regular file"});
  if (static_cast<uint64_t>(st.st_size) > kMaxFileSize) {
    return fail({path + ": " + std::to_string(st.st_size) + " bytes is larger than the " +
                 std::to_string(kMaxFileSize) + "-byte limit for a model file"});
  }
  // One byte of room beyond the size seen, to notice a file that grew.
  const size_t size = static_cast<size_t>(st.st_size);
  FileContents file{std::make_unique_for_overwrite<uint8_t[]>(size + 1), 0};
  while (file.size < size + 1) {
    const size_t asked = size + 1 - file.size;
    ssize_t n = ::read(fd.get(), file.data.get() + file.size, asked);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return fail(errnoError(path, "cannot read", errno));
    if (n == 0) break;
    file.size += static_cast<size_t>(n);
    // A read of a regular file that stops short at the size seen has reached
    // its end: the file is read in one call.
    if (static_cast<size_t>(n) < asked && file.size == size) break;
  }
  if (file.size > size) return fail({path + ": changed while being read"});
  return file;
}

std::optional<std::vector<uint8_t>> PBStreamReader::readFile(const std::string& path,
                                                             NSError* error) {
  std::optional<FileContents> file = readFileContents(path, error);
  if (!file) return std::nullopt;
  return std::vector<uint8_t>(file->data.get(), file->data.get() + file->size);
}

bool PBStreamReader::nextFrame(std::span<const uint8_t> bytes, size_t* offset,
                               std::span<const uint8_t>* body, size_t index, NSError* error) {
  const size_t start = *offset;
  uint64_t length = 0;
  size_t pos = start;
  for (int shift = 0;; shift += 7) {
    if (pos >= bytes.size()) {
      if (error)
        *error = {"the length of message " + std::to_string(index) + " at offset " +
                  std::to_string(start) + " is cut short"};
      return false;
    }
    if (shift == 63 && bytes[pos] > 1) {
      if (error)
        *error = {"the length of message " + std::to_string(index) + " at offset " +
                  std::to_string(start) + " is not a valid varint"};
      return false;
    }
    uint8_t b = bytes[pos++];
    length |= uint64_t{b & 0x7fu} << shift;
    if (!(b & 0x80)) break;
  }
  const size_t remaining = bytes.size() - pos;
  if (length > remaining) {
    if (error)
      *error = {"message " + std::to_string(index) + " at offset " + std::to_string(start) +
                " claims " + std::to_string(length) + " bytes but only " +
                std::to_string(remaining) + " remain in the file"};
    return false;
  }
  *body = bytes.subspan(pos, static_cast<size_t>(length));
  *offset = pos + static_cast<size_t>(length);
  return true;
}

NSError PBStreamReader::messageError(size_t index, size_t offset) {
  return {"message " + std::to_string(index) + " at offset " + std::to_string(offset) +
          " could not be decoded"};
}

}  // namespace kolvrand
