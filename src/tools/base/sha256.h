// SPDX-License-Identifier: Apache-2.0
// SHA-256 by the crypto provider.
#pragma once

#include <array>
#include <initializer_list>
#include <string_view>

namespace tool {

// A digest context of the provider. Used by one thread at a time; every operation throws Failure with kInternal.
class Sha256 {
 public:
  using Digest = std::array<unsigned char, 32>;

  Sha256();
  ~Sha256();
  Sha256(const Sha256&) = delete;
  Sha256& operator=(const Sha256&) = delete;

  // Of the parts, one after the other; each is shorter than 4 GiB.
  Digest of(std::initializer_list<std::string_view> parts);

 private:
  void* provider_ = nullptr;
  void* context_ = nullptr;
  void* digest_ = nullptr;
};

}  // namespace tool
