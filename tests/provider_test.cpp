// SPDX-License-Identifier: Apache-2.0
// The contexts of ciphers and digests over provider entries that note how they are called, and the mapping of provider
// statuses.
#include <gtest/gtest.h>

#include <string>

#include "crypto_provider.h"
#include "support.h"

namespace {

using test::Replaced;
using test::TraceCapture;
using Lines = std::vector<std::string>;

std::string calls;
void* newResult = nullptr;
const void* byNameResult = nullptr;
int cleanupResult = 1;
int freeResult = 1;
char provider, madeContext, algorithmObject;

void* noteNew(void*) {
  calls += "new ";
  return newResult;
}
int noteInit(void*, void* context) {
  calls += context == &madeContext ? "init " : "init? ";
  return 0;
}
const void* noteByName(void*, const char* name) {
  calls += std::string(name) + " ";
  return byNameResult;
}
int noteCleanup(void*, void*) {
  calls += "cleanup ";
  return cleanupResult;
}
int noteFree(void*, void*) {
  calls += "free ";
  return freeResult;
}

struct Pair {
  const char* name;
  int (*init)(void*, void**, const char*, void**);
  int (*release)(void*, void*);
  const char *initInvalid, *newFailed, *byNameFailed, *freeInvalid, *cleanupFailed, *freeFailed;
};

const Pair pairs[] = {
    {"Cipher", initQelCipher, freeQelCipher, "Error - initQelCipher: Invalid parameter. rc = 1\n",
     "Error - initQelCipher: QEL_EVP_CIPHER_CTX_new() failed. rc = 1\n",
     "Error - initQelCipher: QEL_EVP_get_cipherbyname() failed. rc = 1\n",
     "Error - freeQelCipher: Invalid parameter. rc = 1\n",
     "Error - freeQelCipher: QEL_EVP_CIPHER_CTX_cleanup() failed. rc = 0\n",
     "Error - freeQelCipher: QEL_EVP_CIPHER_CTX_free() failed. rc = 2\n"},
    {"Digest", initQelDigest, freeQelDigest, "Error - initQelDigest: Invalid parameter. rc = 1\n",
     "Error - initQelDigest: QEL_EVP_MD_CTX_new() failed. rc = 1\n",
     "Error - initQelDigest: QEL_EVP_get_digestbyname() failed. rc = 1\n",
     "Error - freeQelDigest: Invalid parameter. rc = 1\n",
     "Error - freeQelDigest: QEL_EVP_MD_CTX_cleanup() failed. rc = 0\n",
     "Error - freeQelDigest: QEL_EVP_MD_CTX_free() failed. rc = 2\n"},
};

class ProviderPairs : public testing::TestWithParam<Pair> {
 protected:
  void SetUp() override {
    calls.clear();
    newResult = &madeContext;
    byNameResult = &algorithmObject;
    cleanupResult = freeResult = 1;
    pQEL_EVP_CIPHER_CTX_new = pQEL_EVP_MD_CTX_new = noteNew;
    pQEL_EVP_CIPHER_CTX_init = pQEL_EVP_MD_CTX_init = noteInit;
    pQEL_EVP_get_cipherbyname = pQEL_EVP_get_digestbyname = noteByName;
    pQEL_EVP_CIPHER_CTX_cleanup = pQEL_EVP_MD_CTX_cleanup = noteCleanup;
    pQEL_EVP_CIPHER_CTX_free = pQEL_EVP_MD_CTX_free = noteFree;
    unused(GetParam().name);
  }
  // The entries of the other pair are not to be called.
  void unused(const std::string& used) {
    (used == "Cipher" ? pQEL_EVP_MD_CTX_new : pQEL_EVP_CIPHER_CTX_new) = nullptr;
    (used == "Cipher" ? pQEL_EVP_MD_CTX_init : pQEL_EVP_CIPHER_CTX_init) = nullptr;
    (used == "Cipher" ? pQEL_EVP_get_digestbyname : pQEL_EVP_get_cipherbyname) = nullptr;
    (used == "Cipher" ? pQEL_EVP_MD_CTX_cleanup : pQEL_EVP_CIPHER_CTX_cleanup) = nullptr;
    (used == "Cipher" ? pQEL_EVP_MD_CTX_free : pQEL_EVP_CIPHER_CTX_free) = nullptr;
  }
  void* context = nullptr;
  void* algorithm = nullptr;
};

TEST_P(ProviderPairs, MakeAndRelease) {
  const Pair& pair = GetParam();
  const TraceCapture trace;
  EXPECT_EQ(pair.init(&provider, &context, "name", &algorithm), 0);
  EXPECT_EQ(context, &madeContext);
  EXPECT_EQ(algorithm, &algorithmObject);
  EXPECT_EQ(pair.release(&provider, context), 0);
  EXPECT_EQ(pair.release(&provider, nullptr), 0);
  EXPECT_EQ(calls, "new init name cleanup free ");
  EXPECT_EQ(trace.messages(), Lines{});
}

TEST_P(ProviderPairs, RefuseNulls) {
  const Pair& pair = GetParam();
  const TraceCapture trace;
  EXPECT_EQ(pair.init(nullptr, &context, "name", &algorithm), 1);
  EXPECT_EQ(pair.init(&provider, nullptr, "name", &algorithm), 1);
  EXPECT_EQ(pair.init(&provider, &context, nullptr, &algorithm), 1);
  EXPECT_EQ(pair.init(&provider, &context, "name", nullptr), 1);
  EXPECT_EQ(pair.release(nullptr, &madeContext), 1);
  EXPECT_EQ(pair.release(nullptr, nullptr), 1);
  EXPECT_EQ(calls, "");
  EXPECT_EQ(trace.messages(), (Lines{pair.initInvalid, pair.initInvalid, pair.initInvalid, pair.initInvalid,
                                     pair.freeInvalid, pair.freeInvalid}));
}

TEST_P(ProviderPairs, FailAsTheProviderDoes) {
  const Pair& pair = GetParam();
  const TraceCapture trace;
  newResult = nullptr;
  EXPECT_EQ(pair.init(&provider, &context, "name", &algorithm), 1);
  EXPECT_EQ(calls, "new ");
  newResult = &madeContext;
  byNameResult = nullptr;
  calls.clear();
  EXPECT_EQ(pair.init(&provider, &context, "name", &algorithm), 1);
  EXPECT_EQ(context, nullptr);
  EXPECT_EQ(calls, "new init name cleanup free ");
  calls.clear();
  cleanupResult = 0;
  EXPECT_EQ(pair.release(&provider, &madeContext), 1);
  EXPECT_EQ(calls, "cleanup ");  // what cannot be cleaned is not released
  cleanupResult = 1;
  freeResult = 2;
  EXPECT_EQ(pair.release(&provider, &madeContext), 1);
  EXPECT_EQ(trace.messages(), (Lines{pair.newFailed, pair.byNameFailed, pair.cleanupFailed, pair.freeFailed}));
  for (const test::Record& r : trace.records()) {
    const bool error = r.text.rfind("Error - ", 0) == 0;
    EXPECT_EQ(r.severity, error ? LDTR_ERROR : LDTR_DEBUG) << r.text;
  }
}

TEST_P(ProviderPairs, TraceTheReleaseInsideAFailedCreation) {
  const Pair& pair = GetParam();
  byNameResult = nullptr;
  const TraceCapture trace;
  EXPECT_EQ(pair.init(&provider, &context, "name", &algorithm), 1);
  std::string order;
  for (const test::Record& r : trace.records()) {
    order += r.kind == LDTR_ENTRY ? "> " : r.kind == LDTR_EXIT ? std::to_string(r.rc) + "< " : "";
    if (r.kind == LDTR_LINE) order += r.text.substr(0, r.text.find_first_of(":.")) + " ";
  }
  const std::string name = pair.name;
  EXPECT_EQ(order, "> initQel" + name + " Error - initQel" + name + " > freeQel" + name + " freeQel" + name +
                       " 0< initQel" + name + " 1< ");
}

INSTANTIATE_TEST_SUITE_P(Both, ProviderPairs, testing::ValuesIn(pairs),
                         [](const auto& chosen) { return std::string(chosen.param.name); });

// ---- Statuses ----

TEST(ProviderStatus, MapsToAnLdapCodeAndShowsItself) {
  static const struct {
    int major, minor, rc;
    const char* output;
  } rows[] = {
      {0, 15, 0, ""},
      {3, 0, 1, "QEL Status - \nmajRC: 3\nminRC: 0\ndesc: what happened\n"},
      {3, 14, 1, "QEL Status - \nmajRC: 3\nminRC: 14\ndesc: what happened\n"},
      {3, 15, 90, "QEL Status - \nmajRC: 3\nminRC: 15\ndesc: what happened\n"},
      {-1, 16, 1, "QEL Status - \nmajRC: -1\nminRC: 16\ndesc: what happened\n"},
      {1, -1, 1, "QEL Status - \nmajRC: 1\nminRC: -1\ndesc: what happened\n"},
  };
  const Replaced notAsked(
      pQEL_GetStatus, +[](void*, QelStatus*) {
        ADD_FAILURE() << "a given record stands as it is";
        return 0;
      });
  for (const auto& row : rows) {
    QelStatus status{row.major, row.minor, "what happened"};
    testing::internal::CaptureStdout();
    EXPECT_EQ(qelStatusToLdap(&provider, &status), row.rc);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), row.output);
  }
  QelStatus endless{1, 15, ""};
  std::memset(endless.desc, 'x', sizeof endless.desc);
  testing::internal::CaptureStdout();
  EXPECT_EQ(qelStatusToLdap(nullptr, &endless), 90);
  EXPECT_EQ(testing::internal::GetCapturedStdout(),
            "QEL Status - \nmajRC: 1\nminRC: 15\ndesc: " + std::string(260, 'x') + "\n");
}

TEST(ProviderStatus, IsAskedOfTheContextWhenNoneIsGiven) {
  const Replaced asked(
      pQEL_GetStatus, +[](void* context, QelStatus* status) {
        EXPECT_EQ(context, &provider);
        EXPECT_EQ(test::toHex(status, sizeof *status), std::string(536, '0'));
        *status = {4, 15, "no memory"};
        return 0;
      });
  testing::internal::CaptureStdout();
  EXPECT_EQ(qelStatusToLdap(&provider, nullptr), 90);
  EXPECT_EQ(testing::internal::GetCapturedStdout(), "QEL Status - \nmajRC: 4\nminRC: 15\ndesc: no memory\n");
  const TraceCapture trace;
  EXPECT_EQ(qelStatusToLdap(nullptr, nullptr), 1);
  EXPECT_EQ(trace.messages(), Lines{"Error - qelStatusToLdap: Invalid parameter. rc = 1\n"});
}

}  // namespace
