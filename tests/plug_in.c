/* SPDX-License-Identifier: Apache-2.0 */
/* A plug-in of the hosts that works with its host while it is loaded. */
void hostIsConstructed(void);

__attribute__((constructor)) static void construct(void) {
  hostIsConstructed();
}
