// SPDX-License-Identifier: MIT
// The sorted string array against a vector of entries.
#include <coffer/esa.h>

#include <algorithm>
#include <cstring>

#include "esa/esa_internal.h"
#include "support/driver.h"

namespace coffer_test {
namespace {

using Entry = std::pair<std::string, CofferVal>;

bool Less(const std::string &a, const std::string &b) { return std::strcmp(a.c_str(), b.c_str()) < 0; }

// The index that a bisection of the keys meets first, or -1.
int32_t Probe(const std::vector<Entry> &e, const std::string &k) {
  for (int32_t low = 0, high = static_cast<int32_t>(e.size()) - 1; low <= high;) {
    int32_t mid = (low + high) / 2;
    int c = std::strcmp(k.c_str(), e[mid].first.c_str());
    if (c == 0) return mid;
    if (c > 0)
      low = mid + 1;
    else
      high = mid - 1;
  }
  return -1;
}

struct Model {
  std::vector<Entry> e;
  int32_t cap, inc;
  int32_t Step() const { return inc > 0 ? inc : 1; }
  int32_t Size() const { return static_cast<int32_t>(e.size()); }
};

std::string Compare(EsaArray *a, const Model &m, TestPool *tp) {
  auto *d = static_cast<EsaArrayData *>(a->data);
  MODEL_EXPECT(ESA_GetSize(a) == m.Size() && d->capacity == m.cap);
  for (int32_t i = 0; i < m.Size(); i++) {
    MODEL_EXPECT(ESA_GetKey(a, i) == m.e[i].first && ESA_GetVal(a, i) == m.e[i].second);
    MODEL_EXPECT(!tp || tp->SizeOf(ESA_GetKey(a, i)) == m.e[i].first.size() + 1);
  }
  coffer::CheckFault fault;
  MODEL_EXPECT(coffer::ESACheckArray(a, &fault));
  return "";
}

}  // namespace

std::string RunEsaModel(Ops &ops, Arena arena) {
  static const std::string kAlphabet("abB0\x80\xff", 6);
  // Capacities and increments include those the array cannot use: a
  // negative capacity, one whose bytes overflow, increments below 1 (which
  // count as 1) and increments whose growth would overflow.
  static const int32_t kIncrements[] = {-2, -1, 0, 1, 2, 3, 4, INT32_MAX, 0x20000000};
  Model m{{}, static_cast<int32_t>(ops.Take(8)) - 2, kIncrements[ops.Take(7)]};
  if (ops.Take(16) == 0) m.cap = 0x20000000;
  OpWatch made(arena.tp);
  EsaArray *a = ESA_AllocArrayEx(arena.pool, m.cap, m.inc);
  if (!a) return made.Refused() || m.cap < 0 || m.cap == 0x20000000 ? "" : "creation failed unrefused";
  MODEL_EXPECT(m.cap >= 0 && m.cap < 0x20000000);
  // Either kind of release callback, each set after the other, which it
  // clears: so each setter finds none of its own kind set before it.
  auto set = [a](bool mp) { return mp ? !ESA_SetMpFreeValFn(a, RecordMpRelease) : !ESA_SetFreeValFn(a, RecordRelease); };
  const bool mp = ops.Take(2);
  MODEL_EXPECT(set(mp) && set(!mp) && set(mp));
  const MemPool *pool = mp ? &a->mp : nullptr;  // what the callback gets, the handle's pool copy
  for (CofferVal next = 0; ops.More(); next++) {  // 0 is a value like any other
    Releases().clear();
    std::vector<CofferVal> dropped;
    OpWatch op(arena.tp);
    const int32_t n = m.Size();
    uint32_t kind = ops.Take(16);
    if (kind < 6) {  // insert
      std::string k = ops.Key(kAlphabet, 3);
      const bool full = n == m.cap;
      // A growth past int32 or 32-bit bytes is refused before any pool call.
      const bool fits = !full || int64_t{n} + m.Step() <= 0x1FFFFFFF;
      const bool ok = ESA_Insert(a, k.c_str(), next);
      MODEL_EXPECT(ok == (fits && !op.Refused()) && (fits || !arena.tp || arena.tp->calls() == op.start));
      if (full && fits && op.RefusedCall() != 0) m.cap += m.Step();  // a refused key copy keeps the growth
      if (ok) m.e.insert(std::upper_bound(m.e.begin(), m.e.end(), k, [](auto &x, auto &y) { return Less(x, y.first); }), {k, next});
    } else if (kind < 11) {  // remove one, a range or all
      int32_t f = static_cast<int32_t>(ops.Take(n + 3)) - 1;
      int32_t e = kind < 8 ? f + 1 : static_cast<int32_t>(ops.Take(n + 3)) - 1;
      if (kind == 10) f = 0, e = n;
      const bool ok = f < e && e <= n && f >= 0;
      MODEL_EXPECT((kind < 8 ? ESA_Remove(a, f) : kind < 10 ? ESA_RemoveRange(a, f, e) : ESA_Clear(a)) == ok);
      if (ok) {
        for (int32_t i = f; i < e; i++) dropped.push_back(m.e[i].second);
        m.e.erase(m.e.begin() + f, m.e.begin() + e);
        if (m.cap - m.Size() >= m.Step() && !op.Refused()) m.cap = m.Size();  // a refused shrink is ignored
      }
    } else if (kind < 13) {  // replace a value: never released
      int32_t i = static_cast<int32_t>(ops.Take(n + 2)) - 1;
      const bool ok = i >= 0 && i < n;
      MODEL_EXPECT(ESA_SetVal(a, i, next) == ok && (ESA_Get(a, i) != nullptr) == ok);
      if (ok) m.e[i].second = next;
    } else if (kind < 15) {  // find: the very index the bisection meets
      std::string k = ops.Key(kAlphabet, 3);
      int32_t at = -7, want = Probe(m.e, k);
      MODEL_EXPECT(ESA_Find(a, k.c_str(), &at) == (want >= 0) && at == (want >= 0 ? want : -7));
    } else if (arena.tp && ops.Take(2)) {
      arena.tp->FailAt(arena.tp->calls());
    } else {
      m.inc = kIncrements[ops.Take(9)];
      ESA_SetCapacityIncrement(a, m.inc);
    }
    MODEL_EXPECT(ReleasedVals(pool) == dropped);
    MODEL_TRY(Compare(a, m, arena.tp));
  }
  Releases().clear();
  ESA_FreeArray(a);
  std::vector<CofferVal> rest;
  for (const Entry &x : m.e) rest.push_back(x.second);
  MODEL_EXPECT(ReleasedVals(pool) == rest);
  return "";
}

}  // namespace coffer_test
