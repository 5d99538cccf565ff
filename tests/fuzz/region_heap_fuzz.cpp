// SPDX-License-Identifier: MIT
// The region heap against its model: the model test's driver on the fuzzer's bytes.
#include <cstdio>
#include <cstdlib>

#include "tests/mempool/heap_driver.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
  std::string fault = coffer_test::DriveHeap(data, size);
  if (!fault.empty()) std::fprintf(stderr, "%s\n", fault.c_str()), std::abort();
  return 0;
}
