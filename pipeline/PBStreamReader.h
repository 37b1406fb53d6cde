// Reads a model file: a sequence of messages, each preceded by its length as a
// varint (the framing of writeDelimitedTo / parseDelimitedFrom, so any protocol
// buffer toolchain can write one).
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "model/PBDataReader.h"
#include "platform/FileManager.h"

namespace kolvrand {

struct NSError {
  std::string localizedDescription;
  const std::string& description() const { return localizedDescription; }
};

class PBStreamReader {
 public:
  // Far above a full model (about 40 KB); anything larger is refused unread.
  static constexpr size_t kMaxFileSize = 4 * 1024 * 1024;

  using FileContents = kolvrand::FileContents;

  // The whole file in one read, or an error when it cannot be opened, is not a
  // regular file or is larger than kMaxFileSize.
  static std::optional<FileContents> readFileContents(const std::string& path, NSError* error);
  // The same in a vector.
  static std::optional<std::vector<uint8_t>> readFile(const std::string& path, NSError* error);

  // The messages of `bytes` in order; an empty input is an empty list. On a
  // length or message cut short, a length past the end, or a message whose
  // read fails: nullopt and *error describes where.
  template <typename Message>
  static std::optional<std::vector<std::shared_ptr<Message>>> readProtoBuffersOfClass(
      std::span<const uint8_t> bytes, NSError* error) {
    std::vector<std::shared_ptr<Message>> messages;
    if (!readEach<Message>(bytes, error,
                           [&](std::shared_ptr<Message> m) { messages.push_back(std::move(m)); }))
      return std::nullopt;
    return messages;
  }

  // The first message of the file at `path` (nullptr when it holds none).
  // Every later message is decoded too, so a damaged one anywhere fails the
  // read as above, but dropped at once: a file of millions of tiny messages
  // costs time, never memory.
  template <typename Message>
  static std::optional<std::shared_ptr<Message>> readFirstProtoBufferOfClass(
      const std::string& path, NSError* error) {
    std::optional<FileContents> file = readFileContents(path, error);
    if (!file) return std::nullopt;
    std::shared_ptr<Message> first;
    if (!readEach<Message>(file->bytes(), error, [&](std::shared_ptr<Message> m) {
          if (!first) first = std::move(m);
        })) {
      if (error) error->localizedDescription = path + ": " + error->localizedDescription;
      return std::nullopt;
    }
    return first;
  }

  template <typename Message>
  static std::optional<std::vector<std::shared_ptr<Message>>> readProtoBuffersOfClass(
      const std::string& path, NSError* error) {
    std::optional<FileContents> file = readFileContents(path, error);
    if (!file) return std::nullopt;
    auto messages = readProtoBuffersOfClass<Message>(file->bytes(), error);
    if (!messages && error) error->localizedDescription = path + ": " + error->localizedDescription;
    return messages;
  }

 private:
  // Decodes the messages of `bytes` in order, handing each to `take`.
  template <typename Message, typename Take>
  static bool readEach(std::span<const uint8_t> bytes, NSError* error, Take&& take) {
    size_t offset = 0;
    for (size_t index = 0; offset < bytes.size(); ++index) {
      const size_t start = offset;
      std::span<const uint8_t> body;
      if (!nextFrame(bytes, &offset, &body, index, error)) return false;
      auto message = std::make_shared<Message>();
      PBDataReader reader(body.data(), body.size());
      if (!message->readFrom(reader)) {
        if (error) *error = messageError(index, start);
        return false;
      }
      take(std::move(message));
    }
    return true;
  }

  // Reads the length of message `index` at *offset and returns its body;
  // *offset moves past the body.
  static bool nextFrame(std::span<const uint8_t> bytes, size_t* offset,
                        std::span<const uint8_t>* body, size_t index, NSError* error);
  static NSError messageError(size_t index, size_t offset);
};

}  // namespace kolvrand
