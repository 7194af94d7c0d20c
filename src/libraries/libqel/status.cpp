// SPDX-License-Identifier: Apache-2.0
// Writing failure records and keeping them in the lane of the thread.
#include "status.h"

#include <openssl/err.h>
#include <openssl/evp.h>

#include <cstdio>
#include <cstring>

#include "lane.h"

namespace qel {
namespace {

FailureRecord* recordOf(Lane* lane, std::uintptr_t context) noexcept {
  for (FailureRecord& record : lane->records) {
    if (record.context == context) return &record;
  }
  return nullptr;
}

void remember(Lane* lane, std::uintptr_t context, const QelStatus& status) noexcept {
  FailureRecord* record = recordOf(lane, context);
  if (record == nullptr) {
    record = &lane->records[lane->oldestRecord];
    lane->oldestRecord = (lane->oldestRecord + 1) % Lane::kRecords;
  }
  record->context = context;
  record->status = status;
}

// Whether the error says that memory ran out. With an algorithm that was fetched, "initialization error" does too:
// OpenSSL raises nothing more when there is no memory for the algorithm's state.
bool isNoMemory(unsigned long error) noexcept {
  if (ERR_GET_REASON(error) == ERR_R_MALLOC_FAILURE) return true;
  return ERR_GET_LIB(error) == ERR_LIB_EVP && ERR_GET_REASON(error) == EVP_R_INITIALIZATION_ERROR;
}

void describe(QelStatus& status, QelReason reason, const char* text) noexcept {
  std::memset(&status, 0, sizeof status);
  status.majRC = 1;
  status.minRC = reason;
  std::snprintf(status.desc, sizeof status.desc, "%s", text);
}

// Adds what OpenSSL raised last. Earlier errors in the queue may be left from somebody else's work.
void addOpensslReason(QelStatus& status, const char* text) noexcept {
  const unsigned long error = ERR_peek_last_error();
  if (error == 0) return;
  if (isNoMemory(error)) status.minRC = QEL_REASON_OUT_OF_MEMORY;
  const char* why = ERR_reason_error_string(error);
  if (why != nullptr) std::snprintf(status.desc, sizeof status.desc, "%s: %s", text, why);
}

}  // namespace

void recordFailure(std::uintptr_t context, QelStatus* status, QelReason reason, Source source,
                   const char* text) noexcept {
  QelStatus failure;
  describe(failure, reason, text);
  if (source == Source::kOpenssl) addOpensslReason(failure, text);
  ERR_clear_error();
  Lane* lane = context == 0 ? nullptr : currentLane();
  if (lane != nullptr) remember(lane, context, failure);
  if (status != nullptr) *status = failure;
}

void lastFailure(std::uintptr_t context, QelStatus& status) noexcept {
  Lane* lane = currentLane();
  const FailureRecord* record = lane == nullptr ? nullptr : recordOf(lane, context);
  if (record == nullptr) {
    clearStatus(&status);
    return;
  }
  status = record->status;
}

void clearStatus(QelStatus* status) noexcept {
  if (status != nullptr) std::memset(status, 0, sizeof *status);
}

}  // namespace qel
