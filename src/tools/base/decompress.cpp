// SPDX-License-Identifier: Apache-2.0
// The decoders over zlib and libzstd.
#include "base/decompress.h"

#define ZSTD_STATIC_LINKING_ONLY  // for an allocator of one's own
#include <zlib.h>
#include <zstd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <new>

#include "base/failure.h"

namespace tool {
namespace {

using namespace std::string_view_literals;

constexpr size_t kHeaderBytes = alignof(std::max_align_t);  // holds the size of a block
static_assert(kHeaderBytes >= sizeof(size_t));

// Blocks that know their size and are wiped when they are released: windows of the export are kept in them.
void* takeBlock(void*, size_t bytes) noexcept {
  if (bytes > SIZE_MAX - kHeaderBytes) return nullptr;
  char* block = static_cast<char*>(malloc(kHeaderBytes + bytes));
  if (block == nullptr) return nullptr;
  memcpy(block, &bytes, sizeof bytes);
  return block + kHeaderBytes;
}

void releaseBlock(void*, void* address) noexcept {
  if (address == nullptr) return;
  char* block = static_cast<char*>(address) - kHeaderBytes;
  size_t bytes = 0;
  memcpy(&bytes, block, sizeof bytes);
  explicit_bzero(block, kHeaderBytes + bytes);
  free(block);
}

void* takeItems(void* opaque, unsigned items, unsigned bytes) noexcept {
  return bytes != 0 && items > SIZE_MAX / bytes ? nullptr : takeBlock(opaque, size_t{items} * bytes);
}

Failure damaged(const char* format) {
  return Failure(kIoError, std::string("the ") + format + " data is damaged");
}

class Gzip : public Decompressor {
 public:
  Gzip() {
    stream_.zalloc = takeItems;
    stream_.zfree = releaseBlock;
    constexpr int kGzipOnly = 16;
    if (inflateInit2(&stream_, kGzipOnly + MAX_WBITS) != Z_OK) throw std::bad_alloc();
  }
  ~Gzip() override { inflateEnd(&stream_); }

  void decode(std::string_view& in, Secret& out, size_t bytes) override {
    const size_t before = out.size();
    out.resize(before + bytes);
    stream_.next_out = reinterpret_cast<unsigned char*>(out.data() + before);
    stream_.avail_out = static_cast<unsigned>(bytes);
    while (stream_.avail_out == bytes && (!ended_ || startNextMember(in))) {  // a member may be empty
      stream_.next_in = reinterpret_cast<unsigned char*>(const_cast<char*>(in.data()));
      stream_.avail_in = static_cast<unsigned>(in.size());
      const int code = inflate(&stream_, Z_NO_FLUSH);
      in.remove_prefix(in.size() - stream_.avail_in);
      if (code == Z_MEM_ERROR) throw std::bad_alloc();
      if (code != Z_OK && code != Z_STREAM_END && code != Z_BUF_ERROR) throw damaged("gzip");
      ended_ = code == Z_STREAM_END;
      if (!ended_) break;
    }
    out.resize(before + bytes - stream_.avail_out);
  }
  bool complete() const noexcept override { return ended_; }

 private:
  // A file may have several members, and zeros behind the last one.
  bool startNextMember(std::string_view& in) {
    in.remove_prefix(std::min(in.find_first_not_of('\0'), in.size()));
    if (in.empty()) return false;
    inflateReset(&stream_);
    ended_ = false;
    return true;
  }

  z_stream stream_{};
  bool ended_ = false;
};

class Zstd : public Decompressor {
 public:
  Zstd() : context_(ZSTD_createDCtx_advanced({takeBlock, releaseBlock, nullptr})) {
    if (!context_) throw std::bad_alloc();
  }

  void decode(std::string_view& in, Secret& out, size_t bytes) override {
    const size_t before = out.size();
    out.resize(before + bytes);
    ZSTD_inBuffer source{in.data(), in.size(), 0};
    ZSTD_outBuffer target{out.data() + before, bytes, 0};
    do {  // a frame may be empty
      const size_t taken = source.pos;
      const size_t code = ZSTD_decompressStream(context_.get(), &target, &source);
      if (ZSTD_isError(code) != 0) throw damaged("zstd");
      if (source.pos > taken || target.pos > 0) complete_ = code == 0;
    } while (complete_ && target.pos == 0 && source.pos < source.size);
    out.resize(before + target.pos);
    in.remove_prefix(source.pos);
  }
  bool complete() const noexcept override { return complete_; }

 private:
  struct Free {
    void operator()(ZSTD_DCtx* context) const noexcept { ZSTD_freeDCtx(context); }
  };
  std::unique_ptr<ZSTD_DCtx, Free> context_;
  bool complete_ = false;
};

}  // namespace

std::unique_ptr<Decompressor> decompressorFor(std::string_view beginning) {
  if (beginning.substr(0, 3) == "\x1F\x8B\x08"sv) return std::make_unique<Gzip>();
  if (beginning.substr(0, 4) == "\x28\xB5\x2F\xFD"sv) return std::make_unique<Zstd>();
  return nullptr;
}

}  // namespace tool
