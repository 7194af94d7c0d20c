// SPDX-License-Identifier: Apache-2.0
// Finding and opening the crypto provider library, resolving its entry table, and closing it. Log readers match the
// texts as they are, with their blanks and without a code; ProviderLoading.FindsACopyOrTellsWhatIsWrong pins all.
#include "provider/qel_utils_load.h"

#include <cstdio>
#include <cstring>

#include "dsutil.h"
#include "provider/qel_utils.h"
#include "provider/qel_utils_table.h"
#include "provider/utils_loader.h"
#include "support/cancellation.h"
#include "support/no_fork.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kLoad = operation(kQelUtils, 1, "loadQelCrypto", {"attachPath"});
constexpr TraceInfo kSystemPath = operation(kQelUtils, 2, "getQelInstallLibPath");
constexpr TraceInfo kShippedPath = operation(kQelUtils, 3, "getKubInstallLibPath");

constexpr size_t kAttachPathSize = 1024;
constexpr char kPathSymbol[] = "treskqels_path";
constexpr char kCopyVariable[] = "TRESK_SHIPPED_QEL";
constexpr char kLocalVariable[] = "TRESK_LOCAL_INSTALL_MODE";
constexpr char kSystemFolder[] = "/usr/lib/";
constexpr char kProviderFolder[] = "/qel";
constexpr char kVersionHint[] = "Error - Check the supported version of TRESK in the install guide.\n";

using PathOperation = int (*)(char* buffer, int size);

PlainOwner<char> joined(const char* first, const char* second, const char* third = "") noexcept {
  const size_t size = std::strlen(first) + std::strlen(second) + std::strlen(third) + 1;
  PlainOwner<char> text(newBytes<char>(size));
  if (text) std::snprintf(text.get(), size, "%s%s%s", first, second, third);
  return text;
}

// The folder of the utility library, which asks the loader for it.
PlainOwner<char> installFolder() noexcept {
  const NoFork unforked;
  return PlainOwner<char>(getKUBInstallLibPath());
}

void** currentLibrary() noexcept {
  return __atomic_load_n(&qelLoadGlobal, __ATOMIC_ACQUIRE);
}

// The library that one call works with: the process's, or one that this call has opened and that is closed again unless
// it becomes the process's.
class Library {
 public:
  Library() noexcept = default;
  ~Library() { close(); }
  Library(const Library&) = delete;
  Library& operator=(const Library&) = delete;

  void** cell() const noexcept { return cell_; }

  // One that was refused before is not the process's in this call.
  void open(const char* path) noexcept {
    cell_ = currentLibrary();
    if (cell_ != nullptr && cell_ != refused_) return;
    cell_ = ldapLoadLib(path, 0);
    isOwn_ = cell_ != nullptr;
  }

  // The process's one stays open: another thread may be asking it too.
  void refuse() noexcept {
    if (!isOwn_) refused_ = cell_;
    close();
  }

  // Of several threads one has its library become the process's, in place of none or of one that is too old, and all go
  // on with that.
  void publish() noexcept {
    for (void** before = refused_; isOwn_ && !replaces(before);) {
      if (ldapGetSymAddress(before, kPathSymbol) == nullptr) continue;
      close();
      cell_ = before;
    }
  }

  // The same for one that is too old itself.
  void leaveOpen() noexcept {
    void** none = nullptr;
    if (isOwn_) replaces(none);
  }

 private:
  // Where it does not, before is the process's library.
  bool replaces(void**& before) noexcept {
    isOwn_ = !__atomic_compare_exchange_n(&qelLoadGlobal, &before, cell_, false, __ATOMIC_ACQ_REL, __ATOMIC_ACQUIRE);
    return !isOwn_;
  }

  void close() noexcept {
    if (isOwn_) ldapUnloadLib(cell_);
    isOwn_ = false;
    cell_ = nullptr;
  }

  void** cell_ = nullptr;
  void** refused_ = nullptr;
  bool isOwn_ = false;
};

// Writes only what differs: threads that resolve the same library at once leave alone what others read already.
void storeEntry(const Entry& entry, void* address) noexcept {
  using Slot [[gnu::may_alias]] = void*;
  auto* slot = static_cast<Slot*>(entry.slot);
  void* before = __atomic_load_n(slot, __ATOMIC_ACQUIRE);
  if (before == address) return;
  __atomic_compare_exchange_n(slot, &before, address, false, __ATOMIC_RELEASE, __ATOMIC_ACQUIRE);
}

int resolveEntries(TracedCall& call, void** library) noexcept {
  for (const Entry& entry : kEntries) {
    void* address = ldapGetSymAddress(library, entry.symbol);
    if (library != nullptr) storeEntry(entry, address);
    if (address == nullptr) {
      return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - loadQelCrypto: ldapGetSymAddress(p%s) failed.\n",
                           entry.symbol);
    }
  }
  return call.leave(LDAPPW_SUCCESS);
}

// A provider that reports the shipped "qel" folder is attached at the folder above it.
int rewriteAttachPath(TracedCall& call, char* attachPath) noexcept {
  const PlainOwner<char> folder = installFolder();
  if (!folder) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - loadQelCrypto: getKUBInstallLibPath failed.\n");
  }
  const size_t length = std::strlen(folder.get());
  if (std::strncmp(attachPath, folder.get(), length) == 0 && std::strcmp(attachPath + length, kProviderFolder) == 0) {
    std::memset(attachPath + length, 0, kAttachPathSize - length);
  }
  return LDAPPW_SUCCESS;
}

int askForAttachPath(TracedCall& call, void** library, char** attachPath) noexcept {
  *attachPath = zeroedBytes<char>(kAttachPathSize);
  if (*attachPath == nullptr) return call.failText(LDAPPW_NO_MEMORY, "Error - loadQelCrypto: Out of Memory!.\n");
  PathOperation pathOperation = nullptr;
  void* address = ldapGetSymAddress(library, kPathSymbol);
  std::memcpy(&pathOperation, &address, sizeof address);
  if (pathOperation(*attachPath, static_cast<int>(kAttachPathSize)) == 0) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - loadQelCrypto: pQEL_PATH failed to get QEL library path.\n");
  }
  (*attachPath)[kAttachPathSize - 1] = '\0';
  call.line(LineClass::debug, "loadQelCrypto:- qelAttachPath = %s\n", *attachPath);
  return rewriteAttachPath(call, *attachPath);
}

int setVariable(const char* name, const char* value) noexcept {
  const NoFork unforked;
  return putEnvVar(name, value);
}

int announceCopy(TracedCall& call, const char* shipped) noexcept {
  const int rc = setVariable(kCopyVariable, shipped);
  return rc == 0 ? LDAPPW_SUCCESS : call.fail(rc, "putEnvVar failed");
}

// The system's copy did not do: where it opened, it is too old.
void dropSystemCopy(TracedCall& call, Library& library) noexcept {
  if (library.cell() == nullptr) return;
  call.line(LineClass::error, kVersionHint);
  call.line(LineClass::debug, "loadQelCrypto: Loading shipped version of qel library.\n");
  library.refuse();
}

// Nor did the shipped copy. One that opens but is too old counts as a success, with the library open and the table
// unresolved: initQelCrypto then reports that there is no context.
int giveUp(TracedCall& call, Library& library) noexcept {
  if (library.cell() == nullptr) return resolveEntries(call, nullptr);  // reports the first entry as missing
  library.leaveOpen();
  call.line(LineClass::error, "Error - loadQelCrypto: ldapGetSymAddress(pQEL_PATH) failed.\n");
  call.line(LineClass::error, kVersionHint);
  return call.leave(LDAPPW_SUCCESS);
}

}  // namespace

PlainOwner<char> getQelInstallLibPath(int mode) noexcept {
  TracedCall call{kSystemPath};
  const bool local = ldap_chkenv(kLocalVariable) != 0;
  if (!local && mode != 1) {
    call.failText(LDAPPW_OPERATIONS_ERROR, "Error - getQelInstallLibPath: Invalid parameter. mode = %d\n", mode);
    return nullptr;
  }
  PlainOwner<char> path = joined(local ? "" : kSystemFolder, qelLibraryName);
  if (!path) {
    call.line(LineClass::debug, " Memory allocation failed ! \n");
    call.leave(LDAPPW_NO_MEMORY);
  }
  return path;
}

PlainOwner<char> getKubInstallLibPath(int mode) noexcept {
  TracedCall call{kShippedPath};
  if (mode != 1 && mode != 2) {
    call.failText(LDAPPW_OPERATIONS_ERROR, "Error - getKubInstallLibPath: Invalid parameter. mode = %d\n", mode);
    return nullptr;
  }
  PlainOwner<char> folder = installFolder();
  if (!folder) {
    call.failText(LDAPPW_OPERATIONS_ERROR, "Error - getKubInstallLibPath: getKUBInstallLibPath() failed. \n");
    return nullptr;
  }
  if (mode == 2) return folder;
  PlainOwner<char> path = joined(folder.get(), "/qel/qellib/", qelLibraryName);
  if (!path) call.failText(LDAPPW_NO_MEMORY, "Error - getKubInstallLibPath: kub_strlcat() failed. \n");
  return path;
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

int loadQelCrypto(char** attachPath) noexcept {
  TracedCall call{kLoad, attachPath};
  if (attachPath == nullptr) return call.invalid();
  *attachPath = nullptr;

  Library library;
  for (bool shipped = false;; shipped = true) {
    if (const int rc = announceCopy(call, shipped ? "TRUE" : "FALSE"); rc != 0) return rc;
    const PlainOwner<char> path = shipped ? getKubInstallLibPath(1) : getQelInstallLibPath(1);
    if (!path) return resolveEntries(call, currentLibrary());
    library.open(path.get());
    if (ldapGetSymAddress(library.cell(), kPathSymbol) != nullptr) {
      library.publish();
      const int rc = askForAttachPath(call, library.cell(), attachPath);
      return rc != LDAPPW_SUCCESS ? rc : resolveEntries(call, library.cell());
    }
    if (shipped) return giveUp(call, library);
    dropSystemCopy(call, library);
  }
}

void unloadQelCrypto(void) noexcept {
  if (isClosed(qelLoadGlobal)) return;
  const NoCancellation uncancelled;
  if (qelCtxGlobal != nullptr) {
    QelStatus status{};
    callEntry(pQEL_Cleanup, qelCtxGlobal, &status);
  }
  if (qelLoadGlobal != nullptr) {
    rememberClosed(qelLoadGlobal);
    ldapUnloadLib(qelLoadGlobal);
  }
}

}  // extern "C"
