// Fuzz target: the associative arrays against its model, on the fuzzer's bytes.
#include "support/driver.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
  return coffer_test::FuzzModel(coffer_test::RunHstaaModel, data, size);
}
