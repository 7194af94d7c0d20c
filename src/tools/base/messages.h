// SPDX-License-Identifier: Apache-2.0
// Messages on standard error. A message is one write, and what it quotes is shown as printable() shows it.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>

namespace tool {

void message(std::string_view text) noexcept;  // "ldappw: text"
void warning(std::string_view text) noexcept;  // "ldappw: warning: text"

// Messages or warnings that can be as many as there are values: of each kind the first are shown, and at the end the
// number of the others.
class Repeated {
 public:
  using Show = void (*)(std::string_view) noexcept;

  Repeated(std::uint64_t most, Show show) noexcept : most_(most), show_(show) {}
  Repeated(const Repeated&) = delete;
  Repeated& operator=(const Repeated&) = delete;
  ~Repeated() { finish(); }

  void add(const std::string& text, const std::string& kind);
  // Counts more of a kind of which as many as are shown have been added.
  void addUnshown(const std::string& kind, std::uint64_t count) { counts_[kind] += count; }
  void finish() noexcept;

 private:
  const std::uint64_t most_;
  const Show show_;
  std::map<std::string, std::uint64_t> counts_;
};

constexpr std::uint64_t kMostOfAKind = 1000;  // problems with values

}  // namespace tool
