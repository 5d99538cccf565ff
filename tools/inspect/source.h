// SPDX-License-Identifier: MIT
// Where coffer-inspect reads a region: a file or a POSIX shared memory
// object, mapped read-only from a byte offset on.
#ifndef COFFER_TOOLS_INSPECT_SOURCE_H
#define COFFER_TOOLS_INSPECT_SOURCE_H

#include <cstddef>
#include <cstdint>

namespace inspect {

struct Source {
  const char *path;  // a file, or null
  const char *shm;   // a shared memory object's name, or null
  uint64_t offset;   // where the region starts in it
};

struct Image {
  const void *bytes;  // the region's first byte
  size_t size;        // bytes readable from there
  void *map;          // what to unmap
  size_t mapLength;
};

// Maps the source read-only (the descriptor is opened O_RDONLY, the mapping
// PROT_READ). Returns null, or a message saying why it could not.
const char *OpenImage(const Source &source, Image *image);
void CloseImage(Image *image);

}  // namespace inspect

#endif
