// SPDX-License-Identifier: MIT
// The reader behind coffer-inspect: each command run on a region image in
// memory, so that the fuzz target runs exactly what the tool runs. Nothing
// here trusts the image: the heap checker, the directory's checks and each
// family's checker (given the region's span) run before anything is
// followed, and every walk is bounded.
#ifndef COFFER_TOOLS_INSPECT_INSPECT_H
#define COFFER_TOOLS_INSPECT_INSPECT_H

#include <cstddef>
#include <cstdint>
#include <cstdio>

namespace inspect {

enum Command { kCheck, kStats, kRoots, kDump };

struct Request {
  Command command;
  bool json;
  const char *name;  // dump: the root's name; null to dump the record at `at`
  uint32_t at;       // dump --at: the container's record
  uint32_t kind;     // dump --kind: a ROOTS_KIND_*
};

// Runs one command on the size bytes at image, writing its report to out.
// Returns the exit status: 0 when the command did what it was asked (for
// check: the region is intact), 1 when the region is damaged or does not
// hold what was asked for.
int Run(const Request &request, const void *image, size_t size, FILE *out);

// Reports an error that stops the tool before any command runs, in the
// form the command would have used.
int Refuse(bool json, FILE *out, const char *message);

}  // namespace inspect

#endif
