// SPDX-License-Identifier: MIT
// Opening a region read-only. The tool never writes: the descriptor is
// opened O_RDONLY and mapped PROT_READ, so a mistake here faults instead of
// changing a live region.
#include "tools/inspect/source.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

namespace inspect {
namespace {

char g_message[512];

const char *Say(const char *what, const char *name) {
  std::snprintf(g_message, sizeof g_message, "%s: %s%s%s", name, what, errno ? ": " : "",
                errno ? std::strerror(errno) : "");
  return g_message;
}

int OpenSource(const Source &s) {
  if (s.path) return open(s.path, O_RDONLY | O_CLOEXEC);
  return shm_open(s.shm, O_RDONLY, 0);
}

}  // namespace

const char *OpenImage(const Source &s, Image *image) {
  std::memset(image, 0, sizeof *image);
  const char *name = s.path ? s.path : s.shm;
  errno = 0;
  const int fd = OpenSource(s);
  if (fd < 0) return Say("cannot open", name);
  struct stat st;
  if (fstat(fd, &st) != 0) return close(fd), Say("cannot read its size", name);
  errno = 0;
  if (s.offset % 4 != 0) return close(fd), Say("--offset is not a multiple of 4", name);
  if (st.st_size <= 0 || static_cast<uint64_t>(st.st_size) <= s.offset)
    return close(fd), Say("nothing at that offset (the file is smaller)", name);
  // A 32-bit offset and size are all a region can have.
  const uint64_t page = static_cast<uint64_t>(sysconf(_SC_PAGESIZE));
  const uint64_t start = s.offset / page * page, skip = s.offset - start;
  uint64_t length = static_cast<uint64_t>(st.st_size) - start;
  if (length - skip > 0xFFFFFFFFu) length = skip + 0xFFFFFFFFu;
  if (length > static_cast<size_t>(-1)) return close(fd), Say("too large to map here", name);
  void *map = mmap(nullptr, static_cast<size_t>(length), PROT_READ, MAP_SHARED, fd,
                   static_cast<off_t>(start));
  close(fd);
  if (map == MAP_FAILED) return Say("cannot map", name);
  image->map = map;
  image->mapLength = static_cast<size_t>(length);
  image->bytes = static_cast<const char *>(map) + skip;
  image->size = static_cast<size_t>(length - skip);
  return nullptr;
}

void CloseImage(Image *image) {
  if (image->map) munmap(image->map, image->mapLength);
  image->map = nullptr;
}

}  // namespace inspect
