// SPDX-License-Identifier: MIT
#include "pipeline/PBStreamReader.h"

#include "platform/FileManager.h"

namespace kolvrand {

std::optional<PBStreamReader::FileContents> PBStreamReader::readFileContents(
    const std::string& path, NSError* error) {
  std::string why;
  auto file =
      NSFileManager::defaultManager().contentsOfRegularFile(path, kMaxFileSize, "model file", &why);
  if (!file && error) error->localizedDescription = std::move(why);
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
