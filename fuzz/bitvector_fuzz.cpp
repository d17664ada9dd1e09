// A sequence of bit-set operations, chosen by the input, run on two sets and on a std::set
// model of each; any disagreement aborts.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <iterator>
#include <set>
#include <utility>
#include <vector>

#include "VXException.h"
#include "VXMemFile.h"
#include "bitvector.h"

namespace {

using Model = std::set<uint32_t>;

void Check(bool ok) {
  if (!ok) std::abort();
}

void CheckSame(const CBitVector& v, const Model& m) {
  std::vector<uint32_t> got;
  v.Convert(got);
  Check(got.size() == m.size() && std::equal(got.begin(), got.end(), m.begin()));
  Check(v.Count() == m.size());
  Check(v.Low() == (m.empty() ? CBitVector::npos : *m.begin()));
  Check(v.High() == (m.empty() ? CBitVector::npos : *m.rbegin() + 1));
  Check(m.empty() || *m.rbegin() < v.Size());
}

struct Side {
  CBitVector v;
  Model m;
};

void Apply(Side& a, Side& b, uint8_t op, uint32_t i, uint32_t j) {
  switch (op % 14) {
    case 0:
      a.v.Set(i);
      a.m.insert(i);
      break;
    case 1:
      a.v.SetBulk(i);
      a.m.insert(i);
      break;
    case 2:
      a.v.Reset(i);
      a.m.erase(i);
      break;
    case 3: {
      a.v &= b.v;
      Model r;
      for (uint32_t x : a.m) {
        if (b.m.count(x)) r.insert(x);
      }
      a.m = std::move(r);
      break;
    }
    case 4:
      a.v |= b.v;
      a.m.insert(b.m.begin(), b.m.end());
      break;
    case 5: {
      a.v.AndNot(b.v);
      for (uint32_t x : b.m) a.m.erase(x);
      break;
    }
    case 6: {
      if (a.v.Size() > (1u << 18)) break;  // keeps the model affordable
      a.v = ~a.v;
      Model r;
      for (uint32_t x = 0; x < a.v.Size(); ++x) {
        if (!a.m.count(x)) r.insert(r.end(), x);
      }
      a.m = std::move(r);
      break;
    }
    case 7: {
      auto it = a.m.lower_bound(i);
      Check(a.v.NextSet(i) == (it == a.m.end() ? CBitVector::npos : *it));
      it = a.m.upper_bound(i);
      Check(a.v.PrevSet(i) == (it == a.m.begin() ? CBitVector::npos : *std::prev(it)));
      break;
    }
    case 8: {
      uint32_t from = std::min(i, j), to = std::max(i, j);
      auto n = std::distance(a.m.lower_bound(from), a.m.lower_bound(to));
      Check(a.v.Count(from, to) == static_cast<uint32_t>(n));
      break;
    }
    case 9: {
      CVXMemFile f;
      f << a.v;
      f.Rewind();
      CBitVector back;
      f >> back;
      Check(back == a.v);
      Check(back.Size() == a.v.BufferSize() * 8);
      break;
    }
    case 10:
      a.v.Resize(i);
      a.m.erase(a.m.lower_bound(i), a.m.end());
      break;
    case 11:
      a.v.Clear();
      a.m.clear();
      break;
    case 12:
      std::swap(a, b);
      break;
    default: {
      Check((a.v == b.v) == (a.m == b.m));
      Check(a.v.Get(i) == (a.m.count(i) == 1));
      Model walked;
      for (uint32_t x : a.v) walked.insert(walked.end(), x);
      Check(walked == a.m);
      break;
    }
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  Side a, b;
  // Each step: an op byte and two 16-bit values; the op's high bits scale the values so that
  // indices reach about 1 << 20 while most stay small and dense.
  for (size_t k = 0; k + 5 <= size; k += 5) {
    const uint8_t* p = data + k;
    unsigned shift = (p[0] >> 4) % 5;
    uint32_t i = static_cast<uint32_t>(p[1] | p[2] << 8) << shift;
    uint32_t j = static_cast<uint32_t>(p[3] | p[4] << 8) << shift;
    try {
      Apply(a, b, p[0] & 0x0F ? p[0] : p[0] >> 4, i, j);
    } catch (CVXException* e) {
      delete e;
      std::abort();  // no index used here is out of range
    }
    CheckSame(a.v, a.m);
    CheckSame(b.v, b.m);
  }
  return 0;
}
