// SPDX-License-Identifier: Apache-2.0
// The provider's entries. The input is a program: each step names an entry and its arguments, handles among them that
// are live, released, of another kind or context, or made up. A model of what is live knows what has to fail.
#include <map>
#include <vector>

#include "fuzz_input.h"
#include "qel.h"

using namespace fuzz;

namespace {

enum Kind : unsigned { kContext, kDigest, kCipher, kDigestCtx, kCipherCtx, kKinds };

// What a live handle leads to. Digest and cipher contexts have the size of the algorithm of their last init.
struct Object {
  Kind kind;
  uintptr_t owner;
  size_t size = 0;          // of a digest or a cipher block
  uintptr_t algorithm = 0;  // of the last init
  bool isRunning = false;
  bool encrypts = false;
  bool isStrict = true;  // of a provider context
};

class Machine {
 public:
  explicit Machine(Input input) : input_(input) {}

  void run() {
    makeContext();
    while (!input_.empty()) step();
    while (!live_.empty()) {
      context_ = live_.begin()->second.owner;
      if (context_ == 0) context_ = live_.begin()->first;
      release();
    }
  }

 private:
  void step() {
    static void (*const kEntries[])(Machine&) = {
        [](Machine& m) { m.makeContext(); },
        [](Machine& m) { m.release(); },
        [](Machine& m) { m.attach(); },
        [](Machine& m) { m.value(); },
        [](Machine& m) { m.statusAndPath(); },
        [](Machine& m) { m.random(); },
        [](Machine& m) { m.find(QEL_EVP_get_digestbyname, QEL_EVP_MD_size, kDigest); },
        [](Machine& m) { m.find(QEL_EVP_get_cipherbyname, QEL_EVP_CIPHER_block_size, kCipher); },
        [](Machine& m) { m.sizes(kDigest); },
        [](Machine& m) { m.sizes(kCipher); },
        [](Machine& m) { m.make(QEL_EVP_MD_CTX_new, kDigestCtx); },
        [](Machine& m) { m.make(QEL_EVP_CIPHER_CTX_new, kCipherCtx); },
        [](Machine& m) { m.wipe(QEL_EVP_MD_CTX_free, kDigestCtx, true); },
        [](Machine& m) { m.wipe(QEL_EVP_CIPHER_CTX_free, kCipherCtx, true); },
        [](Machine& m) { m.wipe(QEL_EVP_MD_CTX_init, kDigestCtx); },
        [](Machine& m) { m.wipe(QEL_EVP_CIPHER_CTX_init, kCipherCtx); },
        [](Machine& m) { m.wipe(QEL_EVP_MD_CTX_cleanup, kDigestCtx); },
        [](Machine& m) { m.wipe(QEL_EVP_CIPHER_CTX_cleanup, kCipherCtx); },
        [](Machine& m) { m.digestInit(); },
        [](Machine& m) { m.digestUpdate(); },
        [](Machine& m) { m.digestFinal(); },
        [](Machine& m) { m.cipherInit(QEL_EVP_EncryptInit, true); },
        [](Machine& m) { m.cipherInit(QEL_EVP_DecryptInit, false); },
        [](Machine& m) { m.cipherUpdate(QEL_EVP_EncryptUpdate, true); },
        [](Machine& m) { m.cipherUpdate(QEL_EVP_DecryptUpdate, false); },
        [](Machine& m) { m.cipherFinal(QEL_EVP_EncryptFinal, true); },
        [](Machine& m) { m.cipherFinal(QEL_EVP_DecryptFinal, false); },
        [](Machine& m) { m.cipherSettings(); },
    };
    const unsigned entry = input_.byte() % std::size(kEntries);
    context_ = entry == 0 ? 0 : handle(kContext);
    kEntries[entry](*this);
  }

  template <typename T>
  static T* as(uintptr_t handle) {
    return reinterpret_cast<T*>(handle);
  }

  // Usually one of the handles that there were of this kind, the latest with 0; else any, a near miss, or any number.
  uintptr_t handle(Kind kind) {
    const unsigned choice = input_.byte();
    const std::vector<uintptr_t>& known = known_[choice < 224 ? kind : choice % kKinds];
    if (choice == 255 || known.empty()) return input_.number<uintptr_t>();
    const uintptr_t found = known[known.size() - 1 - choice % 32 % known.size()];
    return choice == 254 ? found ^ uintptr_t { 1 } << input_.byte() % (8 * sizeof found) : found;
  }
  QEL_CTX* ctx() const { return as<QEL_CTX>(context_); }
  QelStatus* record() { return input_.byte() % 4 == 0 ? nullptr : &status_; }
  Block name() { return Block::text(input_.counted()); }

  // The live object of the context of this step, or null where the entry has to fail.
  Object* live(uintptr_t handle, Kind kind) {
    const auto found = live_.find(handle);
    const bool fits = found != live_.end() && found->second.kind == kind;
    return fits && (kind == kContext || found->second.owner == context_) ? &found->second : nullptr;
  }
  bool isLive() { return live(context_, kContext) != nullptr; }

  Object* add(const void* handle, Kind kind) {
    const auto value = reinterpret_cast<uintptr_t>(handle);
    if (value == 0) return nullptr;
    if (live_.count(value) == 0) known_[kind].push_back(value);
    return &live_.insert({value, Object{kind, context_}}).first->second;
  }

  void makeContext() {
    if (known_[kContext].size() < 3) require(add(QEL_Init(record(), name().text()), kContext) != nullptr);
  }
  void release() {
    const bool wasLive = isLive();
    require(QEL_Cleanup(ctx(), record()) == wasLive);
    for (auto at = live_.begin(); wasLive && at != live_.end();) {
      at = at->first == context_ || at->second.owner == context_ ? live_.erase(at) : ++at;
    }
  }
  void attach() { require(QEL_Attach(ctx(), record()) == isLive()); }
  void value() {
    const int id = static_cast<signed char>(input_.byte());
    const Block text = name();
    const Block buffer(input_.byte());
    const bool isSet = QEL_SetValue(ctx(), record(), id, text.text()) == 1;
    const bool isGot = QEL_GetValue(ctx(), record(), id, buffer.text(), buffer.length()) == 1;
    require(isLive() || (!isSet && !isGot));
    require(!isSet || !isGot || buffer.text() == std::string(text.text()));
    if (isSet && id == QEL_VALUE_STRICT) live_.at(context_).isStrict = text.text() == std::string("on");
  }
  void statusAndPath() {
    require(QEL_GetStatus(ctx(), &status_) == isLive() && QEL_GetStatus(ctx(), nullptr) == 0);
    require(std::memchr(status_.desc, '\0', sizeof status_.desc) != nullptr);
    const Block buffer(input_.number<uint16_t>() % 512);
    const int found = treskqels_path(buffer.text(), buffer.length());
    require(found == 0 || std::memchr(buffer.text(), '\0', buffer.view().size()) != nullptr);
  }
  void random() {
    const Block buffer(input_.byte());
    const int count = input_.byte() == 0 ? -1 : buffer.length();
    const int rc = count >= 0 && isLive();
    require(QEL_RAND_bytes(ctx(), buffer.bytes(), count) == rc);
    require(QEL_GenerateRandomSeed(ctx(), record(), buffer.bytes(), count) == rc);
    require(QEL_RAND_seed(ctx(), buffer.bytes(), count) == rc);
  }

  template <typename Algorithm>
  void find(const Algorithm* (*entry)(QEL_CTX*, const char*), int (*size)(QEL_CTX*, const Algorithm*), Kind kind) {
    const Algorithm* found = entry(ctx(), name().text());
    require(found == nullptr || isLive());
    if (found != nullptr) add(found, kind)->size = static_cast<size_t>(size(ctx(), found));
  }
  void sizes(Kind kind) {
    const uintptr_t any = handle(kind);
    const auto* digest = as<QEL_DIGEST>(any);
    const auto* cipher = as<QEL_CIPHER>(any);
    const int ofDigest = QEL_EVP_MD_size(ctx(), digest) | QEL_EVP_MD_block_size(ctx(), digest);
    const int ofCipher = QEL_EVP_CIPHER_key_length(ctx(), cipher) | QEL_EVP_CIPHER_iv_length(ctx(), cipher) |
                         QEL_EVP_CIPHER_block_size(ctx(), cipher);
    require(ofDigest >= 0 && (ofDigest == 0 || live(any, kDigest) != nullptr));
    require(ofCipher >= 0 && (ofCipher == 0 || live(any, kCipher) != nullptr));
  }
  template <typename Context>
  void make(Context* (*entry)(QEL_CTX*), Kind kind) {
    require((add(entry(ctx()), kind) != nullptr) == isLive());
  }
  template <typename Context>
  void wipe(int (*entry)(QEL_CTX*, Context*), Kind kind, bool ends = false) {
    const uintptr_t any = handle(kind);
    Object* const object = live(any, kind);
    require(entry(ctx(), as<Context>(any)) == (object != nullptr));
    if (object != nullptr) *object = {kind, context_};
    if (object != nullptr && ends) live_.erase(any);
  }

  void digestInit() {
    const uintptr_t any = handle(kDigestCtx);
    const uintptr_t algorithm = handle(kDigest);
    Object* const object = live(any, kDigestCtx);
    const Object* const digest = live(algorithm, kDigest);
    const int rc = QEL_EVP_DigestInit(ctx(), as<QEL_MD_CTX>(any), as<QEL_DIGEST>(algorithm));
    require(rc == (object != nullptr && digest != nullptr));
    if (rc == 1) *object = {kDigestCtx, context_, digest->size, algorithm, true};
  }
  void digestUpdate() {
    const uintptr_t any = handle(kDigestCtx);
    const Object* const object = live(any, kDigestCtx);
    const Block data(input_.counted());
    const int rc = QEL_EVP_DigestUpdate(ctx(), as<QEL_MD_CTX>(any), data.text(), static_cast<unsigned>(data.length()));
    require(rc == (object != nullptr && object->isRunning));
  }
  void digestFinal() {
    const uintptr_t any = handle(kDigestCtx);
    Object* const object = live(any, kDigestCtx);
    const bool isRunning = object != nullptr && object->isRunning;
    const Block out(isRunning ? object->size : 0);
    unsigned length = 77;
    require(QEL_EVP_DigestFinal(ctx(), as<QEL_MD_CTX>(any), out.bytes(), &length) == isRunning);
    require(length == out.view().size());
    if (isRunning) object->isRunning = false;
  }

  using Init = int (*)(QEL_CTX*, QEL_CIPHER_CTX*, const QEL_CIPHER*, const unsigned char*, const unsigned char*);
  using Update = int (*)(QEL_CTX*, QEL_CIPHER_CTX*, unsigned char*, int*, const unsigned char*, int);
  using Final = int (*)(QEL_CTX*, QEL_CIPHER_CTX*, unsigned char*, int*);

  void cipherInit(Init entry, bool encrypts) {
    const uintptr_t any = handle(kCipherCtx);
    const uintptr_t algorithm = handle(kCipher);
    Object* const object = live(any, kCipherCtx);
    const Object* const cipher = live(algorithm, kCipher);
    const Block key(static_cast<size_t>(QEL_EVP_CIPHER_key_length(ctx(), as<QEL_CIPHER>(algorithm))));
    const Block vector(static_cast<size_t>(QEL_EVP_CIPHER_iv_length(ctx(), as<QEL_CIPHER>(algorithm))));
    input_.counted().copy(key.text(), key.view().size());
    input_.counted().copy(vector.text(), vector.view().size());
    const bool starts =
        entry(ctx(), as<QEL_CIPHER_CTX>(any), as<QEL_CIPHER>(algorithm), key.bytes(), vector.bytes()) == 1;
    const bool mayStart = object != nullptr && cipher != nullptr;
    require(mayStart || !starts);
    if (mayStart) *object = {kCipherCtx, context_, cipher->size, starts ? algorithm : 0, starts, encrypts};
  }

  // A cipher context for a step in this direction; null where it has to fail. Without the strict checks OpenSSL decides
  // what follows a final step.
  Object* running(uintptr_t handle, bool encrypts) {
    Object* const object = live(handle, kCipherCtx);
    if (object == nullptr || object->algorithm == 0 || object->encrypts != encrypts) return nullptr;
    return object->isRunning || !live_.at(context_).isStrict ? object : nullptr;
  }
  void cipherUpdate(Update entry, bool encrypts) {
    const uintptr_t any = handle(kCipherCtx);
    const Object* const object = running(any, encrypts);
    const unsigned choice = input_.byte();
    const Block in(input_.counted());
    const Block out(in.view().size() + (object == nullptr ? 0 : object->size));
    in.view().copy(out.text(), in.view().size());
    int length = 77;
    const int rc = entry(ctx(), as<QEL_CIPHER_CTX>(any), out.bytes(), &length,
                         choice % 2 == 0 ? in.bytes() : out.bytes(), choice < 250 ? in.length() : -in.length());
    require(rc == 1 ? object != nullptr && length >= 0 && length <= out.length() : length == 0);
  }
  void cipherFinal(Final entry, bool encrypts) {
    const uintptr_t any = handle(kCipherCtx);
    Object* const object = running(any, encrypts);
    const Block out(object == nullptr ? 0 : object->size);
    int length = 77;
    const int rc = entry(ctx(), as<QEL_CIPHER_CTX>(any), out.bytes(), &length);
    require(rc == 1 ? object != nullptr && length >= 0 && length <= out.length() : length == 0);
    if (object != nullptr) object->isRunning = false;
  }
  void cipherSettings() {
    const uintptr_t any = handle(kCipherCtx);
    const Object* const object = live(any, kCipherCtx);
    auto* context = as<QEL_CIPHER_CTX>(any);
    require(QEL_EVP_CIPHER_CTX_cipher(ctx(), context) == as<QEL_CIPHER>(object == nullptr ? 0 : object->algorithm));
    require(QEL_EVP_CIPHER_CTX_set_padding(ctx(), context, static_cast<int>(input_.byte() % 2)) == (object != nullptr));
    const auto length = static_cast<signed char>(input_.byte());
    require(QEL_EVP_CIPHER_CTX_set_key_length(ctx(), context, length) == 0 || (object != nullptr && length > 0));
  }

  Input input_;
  uintptr_t context_ = 0;  // of the step
  QelStatus status_{};
  std::map<uintptr_t, Object> live_;
  std::vector<uintptr_t> known_[kKinds];  // also those that are no more, in the order of their making
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  Machine(Input(data, size)).run();
  return 0;
}
