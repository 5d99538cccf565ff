// SPDX-License-Identifier: MIT
// Fuzz target: every family against its model; the first byte picks it.
#include "support/driver.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
  return coffer_test::FuzzModel(data, size);
}
