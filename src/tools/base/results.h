// SPDX-License-Identifier: Apache-2.0
// Results on standard output, as lines and as JSON.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "base/failure.h"
#include "base/secret.h"

namespace tool {

// Gathers results and writes them to standard output. Its buffer is wiped. Throws Failure with kIoError.
class Results {
 public:
  explicit Results(char end = '\n') noexcept : end_(end) {}
  void write(std::string_view bytes);
  void line(std::string_view text);
  void flush();

 private:
  Secret buffer_;
  char end_;  // of a line
};

// Builds a JSON object in memory that is wiped: a JSON library's buffers are not. Text that is not well-formed UTF-8 is
// given as printable() shows it; what is not seen is escaped, so that a terminal can be shown all of it.
class Json {
 public:
  Json& text(std::string_view name, std::string_view value);
  Json& base64(std::string_view name, std::string_view bytes);
  Json& number(std::string_view name, std::uint64_t value);
  Json& flag(std::string_view name, bool value);
  Json& null(std::string_view name);
  // What an error object says of a problem, whatever it is that failed.
  Json& problem(const Status& status) { return problem(status.text, status.code); }
  Json& problem(std::string_view text, ExitCode code) {
    return this->text("error", text).number("code", static_cast<std::uint64_t>(code));
  }
  // An object or a list within; what stands in a list has an empty name.
  Json& open(std::string_view name) { return begin(name, "{"); }
  Json& close() { return raw("}"); }
  Json& openList(std::string_view name) { return begin(name, "["); }
  Json& closeList() { return raw("]"); }
  // Ends the object; nothing can be added to it then.
  std::string_view end() { return raw("}").text_.view(); }

 private:
  Json& begin(std::string_view name, std::string_view value);
  Json& raw(std::string_view text);
  void quote(std::string_view text);
  void escape(std::uint32_t point);

  Secret text_{"{"};
};

}  // namespace tool
