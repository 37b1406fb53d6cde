// SPDX-License-Identifier: MIT
#include "pipeline/PBStreamReader.h"

#include <cerrno>

#include "platform/FileManager.h"

namespace kolvrand {

std::optional<PBStreamReader::FileContents> PBStreamReader::readFileContents(
    const std::string& path, NSError* error) {
  FileError why;
  auto file = readRegularFile(path, kMaxFileSize, &why);
  if (!file && error)
    error->localizedDescription =
        path + ": " + why.reason + (why.code == EFBIG ? " for a model file" : "");
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
  const wire::Varint v = wire::readVarint(bytes.data() + start, bytes.size() - start);
  if (v.status != wire::VarintStatus::Ok) {
    if (error)
      *error = {
          "the length of message " + std::to_string(index) + " at offset " + std::to_string(start) +
          (v.status == wire::VarintStatus::CutShort ? " is cut short" : " is not a valid varint")};
    return false;
  }
  const uint64_t length = v.value;
  const size_t pos = start + v.size;
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
