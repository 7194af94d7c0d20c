/* SPDX-License-Identifier: Apache-2.0 */
/*
 * A server in small. Eight threads share a store of passwords: seven serve clients, who check, set and read passwords,
 * and one rotates the key meanwhile. docs/server.md walks through it.
 *
 *   cc server.c -o server $(pkg-config --cflags --libs ldappw) -pthread -fPIE -pie -Wl,-z,now
 *   ./server FOLDER      a folder in which it makes its key stash files
 */
#define _GNU_SOURCE /* locks that prefer writers */
#include <pthread.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include "aes_keys.h"
#include "crypto_provider.h"
#include "password_schemes.h"

#if LDAPPW_VERSION < 10000
#error "this program is written for ldappw 1.0"
#endif

enum { kAccounts = 16, kClients = 7, kRotations = 5, kPace = 28, kLongestPassword = 64, kValueSize = 128 };

/* ---- Keys: one that values are made with, and during a rotation the one before it ---- */

/* Prefers writers: of the usual kind busy readers never let one in. */
static pthread_rwlock_t keysLock = PTHREAD_RWLOCK_WRITER_NONRECURSIVE_INITIALIZER_NP;
static AesKeyData* currentKey;
static AesKeyData* formerKey;
static unsigned currentNumber; /* goes up by one with each rotation */

/* Of a value made under that number. The caller holds keysLock for as long as it uses the record. */
static AesKeyData* keyOf(unsigned number) {
  return number == currentNumber ? currentKey : formerKey;
}

/* ---- Accounts: a stored value, and the number of its key, which the value itself does not tell ---- */

struct Value {
  char text[kValueSize]; /* with a NUL */
  int length;
  unsigned keyNumber;
};

struct Account {
  pthread_mutex_t lock; /* taken after keysLock */
  struct Value value;
};

static struct Account accounts[kAccounts];

static struct Value valueOf(struct Account* account) {
  pthread_mutex_lock(&account->lock);
  const struct Value value = account->value;
  pthread_mutex_unlock(&account->lock);
  return value;
}

/* ---- What clients ask for. Each call into the library is made under keysLock, which many may hold at once. ---- */

/* Makes a value with the current key. 0 when there is none, which is not stored then. */
static int makeValue(const char* password, int length, struct Value* value) {
  value->length = format_password(FORMAT_AES256, NULL, currentKey, password, length, value->text, kValueSize);
  value->keyNumber = currentNumber;
  return value->length > 0 && value->length < kValueSize;
}

static int setPassword(struct Account* account, const char* password) {
  struct Value value;
  pthread_rwlock_rdlock(&keysLock);
  const int made = makeValue(password, (int)strlen(password), &value);
  if (made) {
    pthread_mutex_lock(&account->lock);
    account->value = value;
    pthread_mutex_unlock(&account->lock);
  }
  pthread_rwlock_unlock(&keysLock);
  return made;
}

static int checkPassword(struct Account* account, const char* presented) {
  pthread_rwlock_rdlock(&keysLock);
  const struct Value value = valueOf(account);
  const int rc =
      verify_password(presented, (int)strlen(presented), value.text, value.length, 1, keyOf(value.keyNumber));
  pthread_rwlock_unlock(&keysLock);
  return rc == 0;
}

/* Returns the clear text, which the caller releases with _morva_utils_decode_buffer_free, or null. */
static char* readPassword(struct Account* account) {
  char* clear = NULL;
  pthread_rwlock_rdlock(&keysLock);
  const struct Value value = valueOf(account);
  const int read = unformat_password(value.text, &clear, keyOf(value.keyNumber), NULL);
  pthread_rwlock_unlock(&keysLock);
  return read ? clear : NULL;
}

/* ---- Rotation, while clients are served ---- */

/* Makes the account's value again with the current key, unless a client has set a new password meanwhile. */
static int renewValue(struct Account* account) {
  char* clear = NULL;
  int length = 0;
  struct Value value;
  int renewed = 1;
  pthread_rwlock_rdlock(&keysLock);
  pthread_mutex_lock(&account->lock);
  if (account->value.keyNumber != currentNumber) {
    renewed = unformat_password(account->value.text, &clear, formerKey, &length) && makeValue(clear, length, &value);
    if (renewed) account->value = value;
  }
  pthread_mutex_unlock(&account->lock);
  pthread_rwlock_unlock(&keysLock);
  _morva_utils_decode_buffer_free(&clear);
  return renewed;
}

static int served; /* requests; written atomically */

static void rest(void) {
  const struct timespec while_others_run = {0, 100000};
  nanosleep(&while_others_run, NULL);
}

/* Between two accounts clients go first: a rotation has time. */
static void letClientsWork(void) {
  const int until = __atomic_load_n(&served, __ATOMIC_RELAXED) + kPace;
  while (__atomic_load_n(&served, __ATOMIC_RELAXED) < until) rest();
}

static int rotate(const char* stashFile) {
  AesKeyData* fresh = NULL;
  if (setAESKeyData(stashFile, &fresh) != 0) return 0;

  pthread_rwlock_wrlock(&keysLock); /* from here on values are made with the new key */
  formerKey = currentKey;
  currentKey = fresh;
  ++currentNumber;
  pthread_rwlock_unlock(&keysLock);

  int renewed = 1;
  for (int i = 0; i < kAccounts; ++i) {
    letClientsWork();
    renewed &= renewValue(&accounts[i]);
  }
  if (!renewed) return 0; /* the former key is still needed */

  pthread_rwlock_wrlock(&keysLock); /* nobody uses the former key any more */
  AesKeyData* const retired = formerKey;
  formerKey = NULL;
  pthread_rwlock_unlock(&keysLock);
  return freeAesKeyData(retired) == 0;
}

/* ---- The threads ---- */

static char stashFiles[kRotations + 1][256];
static int failures;  /* written atomically */
static int isRotated; /* all rotations are over; likewise */

static void expect(int holds, const char* what) {
  if (holds) return;
  fprintf(stderr, "server: %s\n", what);
  __atomic_add_fetch(&failures, 1, __ATOMIC_RELAXED);
}

static void passwordOf(int account, int version, char* password) {
  snprintf(password, kLongestPassword, "password %d of account %d", version, account);
}

/* Each client has two accounts of its own, so that it knows what their passwords are. */
static void* serveClient(void* argument) {
  const int client = *(const int*)argument;
  char password[kLongestPassword];
  for (int request = 0; !__atomic_load_n(&isRotated, __ATOMIC_RELAXED); ++request) {
    const int number = 2 * client + request % 2;
    struct Account* const account = &accounts[number];
    if (request % 10 < 2) {
      passwordOf(number, request / 10 + 1, password);
      expect(setPassword(account, password), "a password was not set");
    }
    passwordOf(number, request / 10 + 1, password);
    expect(checkPassword(account, password), "the password was refused");
    expect(!checkPassword(account, "another one"), "a wrong password was accepted");
    char* clear = readPassword(account);
    expect(clear != NULL && strcmp(clear, password) == 0, "the password was not read back");
    _morva_utils_decode_buffer_free(&clear);
    __atomic_add_fetch(&served, 1, __ATOMIC_RELAXED);
    rest();
  }
  return NULL;
}

static void* rotateKeys(void* argument) {
  (void)argument;
  for (int i = 1; i <= kRotations; ++i) expect(rotate(stashFiles[i]), "a rotation failed");
  __atomic_store_n(&isRotated, 1, __ATOMIC_RELAXED);
  return NULL;
}

/* An administrator makes these files, with `ldappw keys create` and a seed that nobody can guess. */
static int makeStashFiles(const char* folder) {
  char configuration[256];
  snprintf(configuration, sizeof configuration, "%s/configuration.stash", folder);
  for (int i = 0; i <= kRotations; ++i) {
    char seed[32];
    char* sync = NULL;
    snprintf(seed, sizeof seed, "example-seed-%d", i);
    snprintf(stashFiles[i], sizeof stashFiles[i], "%s/directory-%d.stash", folder, i);
    const int rc = createKeyStashFiles(configuration, stashFiles[i], seed, &sync, NULL);
    free(sync);
    if (rc != 0) return rc;
  }
  return 0;
}

int main(int argc, char** argv) {
  if (argc != 2) {
    fprintf(stderr, "usage: server FOLDER\n");
    return 2;
  }

  /* Without the provider every password would look wrong, so a server that has none does not start. */
  void* provider = NULL;
  int rc = initQelCrypto(&provider);
  if (rc == 0) rc = makeStashFiles(argv[1]);
  if (rc == 0) rc = setAESKeyData(stashFiles[0], &currentKey);
  if (rc != 0) {
    fprintf(stderr, "server: cannot start, code %d; LDTR_EVENTS=0x4011000 shows where it failed\n", rc);
    return 1;
  }

  for (int i = 0; i < kAccounts; ++i) {
    char password[kLongestPassword];
    pthread_mutex_init(&accounts[i].lock, NULL);
    passwordOf(i, 1, password);
    expect(setPassword(&accounts[i], password), "a first password was not set");
  }

  pthread_t threads[kClients + 1];
  int numbers[kClients];
  int started = 0;
  for (int i = 0; i < kClients; ++i) {
    numbers[i] = i;
    if (pthread_create(&threads[started], NULL, serveClient, &numbers[i]) == 0) ++started;
  }
  if (started == kClients && pthread_create(&threads[started], NULL, rotateKeys, NULL) == 0) ++started;
  expect(started == kClients + 1, "a thread did not start");
  if (started <= kClients) __atomic_store_n(&isRotated, 1, __ATOMIC_RELAXED);
  for (int i = 0; i < started; ++i) pthread_join(threads[i], NULL);

  freeAesKeyData(currentKey);
  if (failures == 0) printf("%d threads, %d requests, %d rotations\n", started, served, kRotations);
  return failures == 0 ? 0 : 1;
}
