// SPDX-License-Identifier: Apache-2.0
// Bytes that come in, read without a copy that nobody wipes, and their lines.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <utility>

#include "base/decompress.h"
#include "base/descriptor.h"
#include "base/secret.h"

namespace tool {

constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";

// A file, or standard input, which an empty path or "-" stands for. Every operation throws Failure with kIoError.
class Input {
 public:
  Input() : Input("") {}
  explicit Input(const std::string& path);
  static std::string nameOf(const std::string& path);

  int fd() const noexcept;
  const std::string& name() const noexcept { return name_; }  // for messages

  // Appends what one read of at most so many bytes delivers, kFirstBytes at least; false at the end of the input.
  bool more(Secret& buffer, size_t bytes);

  // Looks at the beginning: a compressed input is decoded from now on, and the content has to be text. Throws Failure
  // (kBadValue) that says what it seems to be otherwise.
  void requireText();
  // What the content seems to be, judged by its beginning.
  const char* seems() const noexcept { return seems_; }
  // Of the file, as far as it has been read: where it is compressed, not those of its content.
  std::uint64_t bytesRead() const noexcept { return bytesRead_; }

 private:
  static constexpr size_t kFirstBytes = 4096;

  bool readOnce(Secret& buffer, size_t bytes);
  bool decodeMore(Secret& buffer, size_t bytes);

  Descriptor file_;
  std::string name_;
  std::unique_ptr<Decompressor> decompressor_;
  Secret ahead_;  // of the content
  Secret raw_;    // of the file, not decoded yet from rawAt_ on
  size_t rawAt_ = 0;
  std::uint64_t bytesRead_ = 0;
  const char* seems_ = "text";
};

// What a line may be: memory must not follow an input that has no lines in it.
struct LineLimit {
  size_t bytes;
  const char* what;
};
constexpr LineLimit kValueLine{size_t{256} << 20, "a value"};
constexpr LineLimit kPasswordLine{size_t{1} << 20, "a password"};
constexpr LineLimit kSeedLine{1016, "a seed"};
constexpr LineLimit kSaltLine{12, "a salt"};

// Splits input at newlines (or another terminator), which are dropped. A carriage return stays, and a last line without
// a newline counts.
class LineReader {
 public:
  LineReader(Input input, LineLimit limit, char end = '\n') : input_(std::move(input)), limit_(limit), end_(end) {}

  // Puts the next line into line; false at the end of the input. Throws Failure with kBadValue for a line beyond the
  // limit.
  bool next(Secret& line);
  // False when next() may have to wait for input: the moment to flush results.
  bool lineBuffered() const noexcept;

 private:
  bool fill();
  void hand(size_t bytes, Secret& line);

  Input input_;
  LineLimit limit_;
  char end_;
  Secret buffer_;
  size_t position_ = 0;
  std::uint64_t lines_ = 0;
  bool ended_ = false;
};

// The first line of a file; throws Failure with kBadValue when there is none.
Secret firstLine(const std::string& path, LineLimit limit);

}  // namespace tool
