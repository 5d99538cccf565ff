// SPDX-License-Identifier: MIT
// Fuzz target: coffer-inspect's reader on the fuzzer's bytes as a region
// image. Every command runs, in text and JSON, then a dump of every root the
// directory names and of a record at an offset the last bytes name, as each
// kind. Whatever the bytes, the reader must neither crash nor loop.
#include <cstdio>
#include <cstring>
#include <vector>

#include "roots/roots_internal.h"
#include "tools/inspect/inspect.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
  static FILE *sink = std::fopen("/dev/null", "w");
  std::vector<uint32_t> words(size / 4 + 1);  // regions start on a 4-byte boundary
  std::memcpy(words.data(), data, size);
  const void *image = words.data();
  using inspect::Request;
  for (bool json : {false, true}) {
    for (inspect::Command c : {inspect::kCheck, inspect::kStats, inspect::kRoots})
      inspect::Run(Request{c, json, nullptr, 0, 0}, image, size, sink);
    const coffer::RegionView view = coffer::ViewOfImage(image, size);
    if (const RootsDirectory *dir = coffer::RootsFindDirectory(view, nullptr))
      for (int32_t i = 0; i < dir->count; i++)
        inspect::Run(Request{inspect::kDump, json, coffer::RootsEntries(view, dir)[i].name, 0, 0}, image, size, sink);
    uint32_t at = 0;
    if (size >= 4) std::memcpy(&at, data + size - 4, 4);
    for (uint32_t kind = 0; kind <= ROOTS_KIND_HST + 1; kind++)
      inspect::Run(Request{inspect::kDump, json, nullptr, at % (size + 1), kind}, image, size, sink);
  }
  return 0;
}
