// SPDX-License-Identifier: MIT
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

  // Where one message of a file lies: its position in the file, the offset
  // of its length and its bytes after the length.
  struct Frame {
    size_t index;
    size_t offset;
    std::span<const uint8_t> body;
  };

  // The frames of `bytes` in order, without decoding them: each is handed to
  // `take(frame)`, which returns false to stop early. false with *error when
  // a length is cut short or reaches past the end.
  template <typename Take>
  static bool forEachFrame(std::span<const uint8_t> bytes, NSError* error, Take&& take) {
    size_t offset = 0;
    for (size_t index = 0; offset < bytes.size(); ++index) {
      const size_t start = offset;
      std::span<const uint8_t> body;
      if (!nextFrame(bytes, &offset, &body, index, error)) return false;
      if (!take(Frame{index, start, body})) return true;
    }
    return true;
  }

  // Why message `index`, whose length is at `offset`, fails.
  static NSError messageError(size_t index, size_t offset);

 private:
  // Decodes the messages of `bytes` in order, handing each to `take`.
  template <typename Message, typename Take>
  static bool readEach(std::span<const uint8_t> bytes, NSError* error, Take&& take) {
    bool decoded = true;
    const bool framed = forEachFrame(bytes, error, [&](const Frame& frame) {
      auto message = std::make_shared<Message>();
      PBDataReader reader(frame.body.data(), frame.body.size());
      if (!message->readFrom(reader)) {
        if (error) *error = messageError(frame.index, frame.offset);
        return decoded = false;
      }
      take(std::move(message));
      return true;
    });
    return framed && decoded;
  }

  // Reads the length of message `index` at *offset and returns its body;
  // *offset moves past the body.
  static bool nextFrame(std::span<const uint8_t> bytes, size_t* offset,
                        std::span<const uint8_t>* body, size_t index, NSError* error);
};

}  // namespace kolvrand
