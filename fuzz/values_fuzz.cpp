// SPDX-License-Identifier: Apache-2.0
// Stored values against presented texts, through every operation that takes a value, with and without a trace. A clear
// text may only match a reversible value that opens into it.
#include "fuzz_input.h"
#include "ldtr.h"
#include "password_schemes.h"

using namespace fuzz;

namespace {

std::string_view leading(std::string_view text) {
  return text.substr(0, 46);
}

struct Clear {
  bool opened = false;
  std::string text;
};

Clear opened(const Block& value, AesKeyData* keys) {
  char* clear = nullptr;
  int length = -1;
  Clear result;
  result.opened = unformat_password(value.text(), &clear, keys, &length) == 1;
  require(result.opened == (clear != nullptr) && (!result.opened || clear[length] == '\0'));
  if (result.opened) result.text.assign(clear, static_cast<size_t>(length));
  _morva_utils_decode_buffer_free(&clear);

  const int code = morva_decodePW(&clear, value.text(), keys);
  require((code == 0) == (clear != nullptr));
  const bool reversible = check_format(value.text(), static_cast<unsigned>(std::strlen(value.text()))) >= FORMAT_QVEIL;
  require(!reversible || (code == 0) == result.opened);
  require(!result.opened || result.text.c_str() == std::string(clear));
  _morva_utils_decode_buffer_free(&clear);
  return result;
}

void tryValue(const Block& presented, const Block& stored, AesKeyData* keys) {
  const int scheme = check_format(stored.text(), static_cast<unsigned>(stored.length()));
  verify_password(presented.text(), presented.length(), stored.text(), stored.length(), 0, keys);
  const bool matches =
      verify_password(presented.text(), presented.length(), stored.text(), stored.length(), 1, keys) == 0;
  const Clear clear = opened(Block::text(stored.view()), keys);
  const bool terminated = stored.view().find('\0') == std::string_view::npos;
  if (!matches || !terminated) return;
  if (scheme >= FORMAT_AES256) require(clear.opened && clear.text == presented.view());
  if (scheme == FORMAT_QVEIL && stored.text()[0] == '{') {
    require(leading(clear.opened ? std::string_view(clear.text) : stored.view()) == leading(presented.view()));
  }
  if (scheme == FORMAT_NONE) require(leading(stored.view()) == leading(presented.view()));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  ldtr_set_sink([](const ldtr_record*, void*) {}, nullptr);
  trcEvents = size % 4 == 0 ? ~0U : 0;  // the lines are made, and dropped
  Input input(data, size);
  const Block presented(input.counted());
  const Block stored(input.rest());
  tryValue(presented, stored, nullptr);
  tryValue(presented, stored, keyRecord());
  return 0;
}
