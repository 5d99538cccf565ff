// SPDX-License-Identifier: MIT
// coffer-inspect's commands on a region image. check and stats walk the
// blocks with the region heap's own checker; roots and dump read only what
// the directory's checks and a record's allocation test have vouched for,
// and dump runs the family's checker (with the region as its span) on a
// container before it reads any more of it.
#include "tools/inspect/inspect.h"

#include <cstdlib>
#include <cstring>

#include "esa/esa_internal.h"
#include "hst/hst_internal.h"
#include "rbt/rbt_internal.h"
#include "mempool/region_heap.h"
#include "roots/roots_internal.h"

namespace inspect {
namespace {

using coffer::RegionView;

// ---- output -----------------------------------------------------------------
// Text for people, or one JSON document. Strings from the region may hold
// any byte: text shows the unprintable ones as \xNN, JSON as \u00NN.

struct Writer {
  FILE *f;
  bool json;
  int depth = 0;
  bool comma[16] = {};

  void Sep(const char *key) {
    if (depth > 0 && comma[depth]) std::fputc(',', f);
    if (depth > 0) comma[depth] = true;
    if (key) Quoted(key), std::fputc(':', f);
  }
  void Begin(const char *key, char open) {
    Sep(key);
    std::fputc(open, f);
    comma[++depth] = false;
  }
  void End(char close) {
    std::fputc(close, f);
    if (--depth == 0) std::fputc('\n', f);
  }
  void U(const char *key, uint64_t v) { Sep(key), std::fprintf(f, "%llu", static_cast<unsigned long long>(v)); }
  void I(const char *key, int64_t v) { Sep(key), std::fprintf(f, "%lld", static_cast<long long>(v)); }
  void B(const char *key, bool v) { Sep(key), std::fputs(v ? "true" : "false", f); }
  void S(const char *key, const char *s) { Sep(key), Quoted(s); }
  int Quoted(const char *s) { return Quoted(s, std::strlen(s)); }
  // Returns the number of characters written.
  int Quoted(const char *s, size_t n) {
    int written = 2;
    std::fputc('"', f);
    for (size_t i = 0; i < n; i++) {
      const unsigned char c = static_cast<unsigned char>(s[i]);
      if (c == '"' || c == '\\')
        written += std::fprintf(f, "\\%c", c);
      else if (c < 0x20 || c >= 0x7F)
        written += std::fprintf(f, json ? "\\u%04x" : "\\x%02x", c);
      else
        written++, std::fputc(c, f);
    }
    std::fputc('"', f);
    return written;
  }
};

// ---- the region's pieces ------------------------------------------------------

struct Ctx {
  const Request &request;
  const void *image;
  size_t size;
  RegionView view;
  Writer w;
};

// The family checker of kind on the record at off, within the region; null
// and fault filled when it finds damage.
bool ContainerSound(const Ctx &c, uint32_t kind, PoolOffset off, coffer::CheckFault *fault) {
  if (const char *why = coffer::RootsRecordFault(c.view, kind, off)) return *fault = {why, off}, false;
  CollectionHeader h = coffer::HandleAt(c.view, off);
  const coffer::CheckSpan span = c.view.Span();
  switch (kind) {
    case ROOTS_KIND_ARRAY: return coffer::ESACheckArray(&h, fault, &span);
    case ROOTS_KIND_HST: return coffer::hst::HSTCheckTree(&h, false, fault, &span);
    default:
      return coffer::RBTCheckTree(&h, static_cast<coffer::RbtKeyKind>(kind - ROOTS_KIND_RBT), fault, &span);
  }
}

// The size a container's record claims, read after RootsRecordFault passed.
int64_t SizeOf(const Ctx &c, uint32_t kind, PoolOffset off) {
  if (kind == ROOTS_KIND_ARRAY) return c.view.At<EsaArrayData>(off)->size;
  if (kind == ROOTS_KIND_HST) return c.view.At<HstTreeData>(off)->size;
  return c.view.At<RbtTreeData>(off)->size;
}

// ---- check ----------------------------------------------------------------------

struct Problems {
  Ctx *c;
  uint32_t damage = 0, notes = 0;

  void Add(const char *where, const char *name, uint32_t at, const char *what, bool isDamage) {
    (isDamage ? damage : notes)++;
    Writer &w = c->w;
    if (w.json) {
      w.Begin(nullptr, '{');
      w.S("where", where);
      if (name) w.S("root", name);
      w.U("offset", at), w.S("what", what), w.B("damage", isDamage);
      return w.End('}');
    }
    std::fprintf(w.f, "%s", where);
    if (name) std::fputc(' ', w.f), w.Quoted(name);
    std::fprintf(w.f, ": %s at %u: %s\n", isDamage ? "damage" : "note", at, what);
  }
};

void HeapFaultTo(void *context, coffer::ShFault fault, uint32_t at) {
  static_cast<Problems *>(context)->Add("heap", nullptr, at, coffer::SHFaultText(fault), coffer::SHFaultIsDamage(fault));
}

void CheckDirectory(Ctx &c, Problems &p) {
  const char *why;
  bool stale;
  const RootsDirectory *dir = coffer::RootsFindDirectory(c.view, &why, &stale);
  if (!dir) {
    // A region without the magic has no directory; one whose words lead to
    // no allocated block holds words from before a format, which is no damage.
    const ShRegionHeader *header = c.view.At<ShRegionHeader>(0);
    if (c.view.limit >= sizeof *header && header->reserved[0] == ROOTS_REGION_MAGIC)
      p.Add("directory", nullptr, header->reserved[1], why, !stale);
    return;
  }
  const RootsEntry *e = coffer::RootsEntries(c.view, dir);
  for (int32_t i = 0; i < dir->count; i++) {
    coffer::CheckFault fault;
    if (!ContainerSound(c, e[i].kind, e[i].record, &fault)) p.Add("root", e[i].name, fault.at, fault.what, true);
  }
}

int Check(Ctx &c) {
  Writer &w = c.w;
  Problems p{&c};
  if (w.json) w.Begin(nullptr, '{'), w.S("command", "check"), w.U("regionSize", c.view.limit), w.Begin("problems", '[');
  const coffer::ShHeapState state = coffer::SHCheckRegion(c.image, c.size, nullptr, HeapFaultTo, &p);
  if (state == coffer::ShHeapState::kNoMemory) p.Add("heap", nullptr, 0, "out of memory: the heap was not checked", true);
  CheckDirectory(c, p);
  if (w.json) {
    w.End(']');
    w.B("intact", p.damage == 0), w.U("damage", p.damage), w.U("notes", p.notes);
    w.End('}');
  } else {
    if (p.damage)
      std::fprintf(w.f, "damaged: %u problem%s\n", p.damage, p.damage == 1 ? "" : "s");
    else
      std::fprintf(w.f, "intact\n");
  }
  return p.damage ? 1 : 0;
}

// ---- stats ------------------------------------------------------------------------

struct FirstDamage {
  coffer::ShFault fault;
  uint32_t at;
  bool seen;
};
void KeepFirstDamage(void *context, coffer::ShFault fault, uint32_t at) {
  auto *k = static_cast<FirstDamage *>(context);
  if (coffer::SHFaultIsDamage(fault) && !k->seen) *k = {fault, at, true};
}

int Stats(Ctx &c) {
  coffer::ShHeapCounts s;
  FirstDamage d = {};
  const coffer::ShHeapState state = coffer::SHCheckRegion(c.image, c.size, &s, KeepFirstDamage, &d);
  if (state == coffer::ShHeapState::kNoMemory) return Refuse(c.w.json, c.w.f, "out of memory: the heap was not walked");
  // Fragmentation: the share of free bytes outside the largest free block.
  const double frag = s.freeBytes ? 1.0 - static_cast<double>(s.largestFree) / s.freeBytes : 0.0;
  Writer &w = c.w;
  if (w.json) {
    w.Begin(nullptr, '{'), w.S("command", "stats"), w.U("regionSize", c.view.limit);
    w.U("blocksInUse", s.allocatedBlocks), w.U("bytesInUse", s.allocatedBytes);
    w.U("blocksFree", s.freeBlocks), w.U("bytesFree", s.freeBytes);
    w.U("largestFree", s.largestFree), w.U("freeListLength", s.freeListLength);
    w.Sep("fragmentation"), std::fprintf(w.f, "%.4f", frag);
    w.Begin("histogram", '[');
    for (int b = 0; b < 32; b++)
      if (s.sizeLog2[b]) w.Begin(nullptr, '{'), w.U("from", 1ull << b), w.U("to", (2ull << b) - 1), w.U("blocks", s.sizeLog2[b]), w.End('}');
    w.End(']');
    w.B("intact", !d.seen);
    if (d.seen) w.U("damageAt", d.at), w.S("damage", coffer::SHFaultText(d.fault));
    w.End('}');
  } else {
    std::fprintf(w.f, "region size         %u bytes\n", c.view.limit);
    std::fprintf(w.f, "blocks in use       %u (%u bytes)\n", s.allocatedBlocks, s.allocatedBytes);
    std::fprintf(w.f, "blocks free         %u (%u bytes)\n", s.freeBlocks, s.freeBytes);
    std::fprintf(w.f, "largest free block  %u bytes\n", s.largestFree);
    std::fprintf(w.f, "free list length    %u\n", s.freeListLength);
    std::fprintf(w.f, "fragmentation       %.4f (free bytes outside the largest free block)\n", frag);
    std::fprintf(w.f, "block sizes (bytes, headers included):\n");
    for (int b = 0; b < 32; b++)
      if (s.sizeLog2[b]) std::fprintf(w.f, "  %10llu .. %-10llu %u\n", 1ull << b, (2ull << b) - 1, s.sizeLog2[b]);
    if (d.seen) std::fprintf(w.f, "damaged at %u: %s (run check for every problem)\n", d.at, coffer::SHFaultText(d.fault));
  }
  return d.seen ? 1 : 0;
}

// ---- roots ------------------------------------------------------------------------

int Roots(Ctx &c) {
  const char *why;
  const RootsDirectory *dir = coffer::RootsFindDirectory(c.view, &why);
  if (!dir) return Refuse(c.w.json, c.w.f, why);
  Writer &w = c.w;
  if (w.json) w.Begin(nullptr, '{'), w.S("command", "roots"), w.Begin("roots", '[');
  else std::fprintf(w.f, "%-24s %-11s %10s  %s\n", "name", "kind", "record", "size");
  const RootsEntry *e = coffer::RootsEntries(c.view, dir);
  for (int32_t i = 0; i < dir->count; i++) {
    const char *fault = coffer::RootsRecordFault(c.view, e[i].kind, e[i].record);
    const char *kind = coffer::RootsKindName(e[i].kind);
    if (w.json) {
      w.Begin(nullptr, '{'), w.S("name", e[i].name), w.S("kind", kind), w.U("record", e[i].record);
      fault ? w.S("damage", fault) : w.I("size", SizeOf(c, e[i].kind, e[i].record));
      w.End('}');
      continue;
    }
    const int width = w.Quoted(e[i].name);
    std::fprintf(w.f, "%*s %-11s %10u  ", width < 24 ? 24 - width : 0, "", kind, e[i].record);
    if (fault)
      std::fprintf(w.f, "damaged: %s\n", fault);
    else
      std::fprintf(w.f, "%lld\n", static_cast<long long>(SizeOf(c, e[i].kind, e[i].record)));
  }
  if (w.json) w.End(']'), w.End('}');
  if (!w.json && dir->count == 0) std::fprintf(w.f, "no roots\n");
  return 0;
}

// ---- dump -------------------------------------------------------------------------

const char *Str(const Ctx &c, PoolOffset off) { return c.view.At<char>(off); }

void Value(Writer &w, CofferVal v) {
  if (w.json) return w.U("value", v);
  std::fprintf(w.f, "%u", static_cast<unsigned>(v));
}

void DumpArray(Ctx &c, PoolOffset off) {
  const EsaArrayData *d = c.view.At<EsaArrayData>(off);
  const EsaEntry *e = c.view.At<EsaEntry>(d->entries);
  Writer &w = c.w;
  if (w.json) w.I("size", d->size), w.Begin("entries", '[');
  else std::fprintf(w.f, "array: %d entries\n", d->size);
  for (int32_t i = 0; i < d->size; i++) {
    if (w.json) {
      w.Begin(nullptr, '{'), w.S("key", Str(c, e[i].key)), Value(w, e[i].val), w.End('}');
      continue;
    }
    w.Quoted(Str(c, e[i].key));
    std::fputs(" = ", w.f), Value(w, e[i].val), std::fputc('\n', w.f);
  }
  if (w.json) w.End(']');
}

void TreeKey(Ctx &c, uint32_t kind, const RbtNode *n) {
  Writer &w = c.w;
  if (kind == ROOTS_KIND_RBT) {
    if (w.json) return w.S("key", Str(c, n->key));
    w.Quoted(Str(c, n->key));
    return;
  }
  if (kind == ROOTS_KIND_RBT_INT32) {
    if (w.json) return w.I("key", static_cast<int32_t>(n->key));
    std::fprintf(w.f, "%d", static_cast<int32_t>(n->key));
    return;
  }
  if (w.json) return w.U("key", n->key);
  std::fprintf(w.f, "0x%08x", n->key);
}

// Depth first, with the explicit stack the checker's depth bound allows.
uint32_t TreeHeight(const Ctx &c, PoolOffset off) {
  const RbtTreeData *d = c.view.At<RbtTreeData>(off);
  struct Item { PoolOffset node; uint32_t depth; } stack[72];
  uint32_t top = 0, height = 0;
  if (d->root != d->nil) stack[top++] = {d->root, 1};
  while (top) {
    const Item it = stack[--top];
    if (it.depth > height) height = it.depth;
    const RbtNode *n = c.view.At<RbtNode>(it.node);
    if (n->left != d->nil) stack[top++] = {n->left, it.depth + 1};
    if (n->right != d->nil) stack[top++] = {n->right, it.depth + 1};
  }
  return height;
}

void DumpTree(Ctx &c, uint32_t kind, PoolOffset off) {
  const RbtTreeData *d = c.view.At<RbtTreeData>(off);
  Writer &w = c.w;
  const uint32_t height = TreeHeight(c, off);
  if (w.json) w.U("size", d->size), w.U("height", height), w.Begin("nodes", '[');
  else std::fprintf(w.f, "%s: %u nodes, height %u\n", coffer::RootsKindName(kind), d->size, height);
  // The checker has vouched for every link, so the tree's own walk may follow them.
  CollectionHeader h = coffer::HandleAt(c.view, off);
  const coffer::RbtCtx tree(&h);
  for (const RbtNode *n = coffer::RBTMinimum(tree); n; n = coffer::RBTSuccessor(tree, n)) {
    if (w.json) w.Begin(nullptr, '{');
    TreeKey(c, kind, n);
    if (w.json) Value(w, n->val), w.End('}');
    else std::fputs(" = ", w.f), Value(w, n->val), std::fputc('\n', w.f);
  }
  if (w.json) w.End(']');
}

// The string tree, depth first in name order, each node with its path, its
// value and the value count kept for associative arrays. Paths longer than
// the buffer end in "...".
struct PathWalk {
  Ctx &c;
  char sep;
  char path[4096] = {};
  struct Frame { PoolOffset node; int32_t next; uint32_t length; } *stack = nullptr;
  uint32_t depth = 0;

  ~PathWalk() { std::free(stack); }
  uint32_t Append(uint32_t length, const char *name) {
    const size_t n = std::strlen(name);
    if (length + 1 + n + 4 > sizeof path) {
      std::memcpy(path + length, "...", 4);
      return length;
    }
    path[length] = sep;
    std::memcpy(path + length + 1, name, n + 1);
    return static_cast<uint32_t>(length + 1 + n);
  }
  void Line(const HstNode *n, uint32_t length, uint32_t level) {
    Writer &w = c.w;
    const size_t shown = length ? std::strlen(path) : 1;
    const char *p = length ? path : &sep;
    if (w.json) {
      w.Begin(nullptr, '{'), w.Sep("path"), w.Quoted(p, shown), w.U("depth", level), Value(w, n->val);
      return w.I("count", n->subtreeValCount), w.End('}');
    }
    std::fprintf(w.f, "%*s", 2 * static_cast<int>(level < 32 ? level : 32), "");
    w.Quoted(p, shown);
    std::fputs(" = ", w.f), Value(w, n->val);
    std::fprintf(w.f, "  (count %d)\n", n->subtreeValCount);
  }
  bool Run(PoolOffset root, int32_t size) {
    stack = static_cast<Frame *>(std::malloc(sizeof(Frame) * static_cast<uint32_t>(size)));
    if (!stack) return false;
    Line(c.view.At<HstNode>(root), 0, 0);
    stack[depth++] = {root, 0, 0};
    while (depth) {
      Frame &f = stack[depth - 1];
      const HstNode *node = c.view.At<HstNode>(f.node);
      const EsaArrayData *kids = node->children ? c.view.At<EsaArrayData>(node->children) : nullptr;
      if (!kids || f.next == kids->size) {
        depth--;
        continue;
      }
      const PoolOffset child = static_cast<PoolOffset>(c.view.At<EsaEntry>(kids->entries)[f.next++].val);
      const HstNode *n = c.view.At<HstNode>(child);
      const uint32_t length = Append(f.length, Str(c, n->key));
      Line(n, length, depth);
      stack[depth++] = {child, 0, length};
    }
    return true;
  }
};

bool DumpStringTree(Ctx &c, PoolOffset off) {
  const HstTreeData *d = c.view.At<HstTreeData>(off);
  Writer &w = c.w;
  const char sep = d->separator >= 0x21 && d->separator < 0x7F ? d->separator : '/';
  if (w.json) w.I("size", d->size), w.Sep("separator"), w.Quoted(&d->separator, 1), w.Begin("nodes", '[');
  else std::fprintf(w.f, "hst: %d nodes, separator '%c'\n", d->size, sep);
  PathWalk walk{c, sep};
  const bool done = walk.Run(d->root, d->size);
  if (w.json) w.End(']');
  return done;
}

int Dump(Ctx &c) {
  uint32_t kind = c.request.kind;
  PoolOffset off = c.request.at;
  if (c.request.name) {
    const char *why;
    const RootsDirectory *dir = coffer::RootsFindDirectory(c.view, &why);
    int32_t at;
    if (!dir) return Refuse(c.w.json, c.w.f, why);
    if (!coffer::RootsSearch(c.view, dir, c.request.name, &at)) return Refuse(c.w.json, c.w.f, "no root of that name");
    const RootsEntry &entry = coffer::RootsEntries(c.view, dir)[at];
    kind = entry.kind, off = entry.record;
  }
  coffer::CheckFault fault;
  if (!ContainerSound(c, kind, off, &fault)) {
    char message[200];
    const char *name = coffer::RootsKindName(kind);
    std::snprintf(message, sizeof message, "%s at %u damaged at %u: %s", name ? name : "record", off,
                  fault.at, fault.what);
    return Refuse(c.w.json, c.w.f, message);
  }
  Writer &w = c.w;
  if (w.json) w.Begin(nullptr, '{'), w.S("command", "dump"), w.S("kind", coffer::RootsKindName(kind)), w.U("record", off);
  bool done = true;
  if (kind == ROOTS_KIND_ARRAY)
    DumpArray(c, off);
  else if (kind == ROOTS_KIND_HST)
    done = DumpStringTree(c, off);
  else
    DumpTree(c, kind, off);
  if (w.json) w.End('}');
  if (!done) std::fprintf(stderr, "coffer-inspect: out of memory during the dump\n");
  return done ? 0 : 1;
}

}  // namespace

int Refuse(bool json, FILE *out, const char *message) {
  Writer w{out, json};
  if (json) {
    w.Begin(nullptr, '{'), w.S("error", message), w.End('}');
  } else {
    std::fprintf(out, "coffer-inspect: %s\n", message);
  }
  return 1;
}

int Run(const Request &request, const void *image, size_t size, FILE *out) {
  Ctx c{request, image, size, coffer::ViewOfImage(image, size), Writer{out, request.json}};
  switch (request.command) {
    case kCheck: return Check(c);
    case kStats: return Stats(c);
    case kRoots: return Roots(c);
    default: return Dump(c);
  }
}

}  // namespace inspect
