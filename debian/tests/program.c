/* SPDX-License-Identifier: Apache-2.0 */
/* Values of a scheme that needs the provider and of one that is reversible, and a trace sink of the program's own. The
 * exit code is the number of the step that failed. */
#include <ldtr.h>
#include <password_schemes.h>
#include <stdlib.h>
#include <string.h>

static void count(const struct ldtr_record* record, void* records) {
  if (record->kind == LDTR_ENTRY) ++*(int*)records;
}

static int matches(const char* password, const char* value, int length) {
  return verify_password(password, (int)strlen(password), value, length, 1, NULL) == 0;
}

int main(void) {
  char value[256];
  char* clear = NULL;
  int records = 0;
  int length = format_password(FORMAT_SSHA, NULL, NULL, "horse", 5, value, (int)sizeof value);
  if (length <= 0) return 1;
  if (!matches("horse", value, length) || matches("house", value, length)) return 2;

  ldtr_set_sink(count, &records);
  trcEvents = 0x4011000;
  length = format_password(FORMAT_QVEIL, NULL, NULL, "horse", 5, value, (int)sizeof value);
  trcEvents = 0;
  if (length <= 0 || records == 0) return 3;
  if (!matches("horse", value, length) || unformat_password(value, &clear, NULL, NULL) != 1) return 4;
  if (strcmp(clear, "horse") != 0) return 5;
  free(clear);
  return 0;
}
