// SPDX-License-Identifier: Apache-2.0
// The two helpers of a server's start-up, against their rules in plain words: the repair of cipher specifications, and
// the completion of the library path, twice in a row, since the second call reads what the first has put there.
#include "encoding_utils.h"
#include "fuzz_input.h"

using namespace fuzz;

namespace {

constexpr char kVariable[] = "LD_LIBRARY_PATH=";
constexpr size_t kName = sizeof kVariable - 1;

void trySpecs(const std::string& given) {
  const Block specs(given.size() + 3);  // with the room that the contract asks for, and the NUL
  given.copy(specs.text(), given.size());
  fixupCipherSpecs(specs.text());
  std::string expected = given;
  const size_t first09 = given.find("09");
  const size_t first0A = given.find("0A");
  if (first09 < first0A && first0A != std::string::npos) expected = expected.insert(first09, "0A").substr(0, 64);
  require(specs.text() == expected);
}

std::string completed(const std::string& path) {
  if ((":" + path.substr(0, 2048) + ":").find(":/usr/lib:") != std::string::npos) return path;
  return (path + ":/usr/lib").substr(0, 2048 - kName);
}

void tryPath(const std::string& given) {
  const Block path = Block::text(kVariable + given);
  require(putenv(path.text()) == 0);  // not setenv, which keeps every value that there ever was
  std::string expected = given;
  for (int round = 0; round < 2; ++round) {
    require(setDefLibpath() == 0);
    expected = completed(expected);
    require(std::getenv("LD_LIBRARY_PATH") == expected);
  }
  require(unsetenv("LD_LIBRARY_PATH") == 0 && setDefLibpath() == 0);
  require(std::getenv("LD_LIBRARY_PATH") == std::string("/usr/lib") && unsetenv("LD_LIBRARY_PATH") == 0);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const Block text = Block::text({reinterpret_cast<const char*>(data), size});
  trySpecs(text.text());
  tryPath(text.text());
  return 0;
}
