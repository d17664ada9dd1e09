#include "bitvector.h"

#include <gtest/gtest.h>

#include <random>
#include <set>
#include <vector>

#include "VXResult.h"
#include "vxlib_test_util.h"

namespace {

using Model = std::set<uint32_t>;

CBitVector Of(std::initializer_list<uint32_t> indices, uint32_t size = 0) {
  CBitVector v;
  v.Resize(size);
  for (uint32_t i : indices) v.Set(i);
  return v;
}

// `count` random changes below `limit`, mostly sets, some resets so that bounds move inward.
CBitVector RandomSet(std::mt19937& rng, uint32_t limit, uint32_t count, Model& model) {
  CBitVector v;
  v.Resize(limit);
  for (uint32_t k = 0; k < count; ++k) {
    uint32_t i = rng() % limit;
    bool set = rng() % 4 != 0;
    v.Set(i, set);
    set ? (void)model.insert(i) : (void)model.erase(i);
  }
  return v;
}

// `v` holds exactly the indices of `m`, and has `size` bits unless that is npos.
void ExpectMatches(const CBitVector& v, const Model& m, uint32_t size = CBitVector::npos) {
  std::vector<uint32_t> got;
  v.Convert(got);
  EXPECT_EQ(got, std::vector<uint32_t>(m.begin(), m.end()));
  EXPECT_EQ(v.Count(), m.size());
  EXPECT_EQ(v.Low(), m.empty() ? CBitVector::npos : *m.begin());
  EXPECT_EQ(v.High(), m.empty() ? CBitVector::npos : *m.rbegin() + 1);
  EXPECT_TRUE(size == CBitVector::npos || v.Size() == size) << v.Size() << " bits";
}

TEST(BitVector, GrowthAndIndexLimits) {
  CBitVector v;
  v.Set(100);
  EXPECT_EQ(v.Size(), 133u);
  v.Set(120);  // within the size: no growth
  EXPECT_EQ(v.Size(), 133u);
  v.SetBulk(200);
  v.Reset(5000);  // resetting beyond the size changes nothing
  ExpectMatches(v, {100, 120, 200}, 1225);

  EXPECT_EQ(ThrownCode([&] { v.RangeCheck(1224); }), 0u);
  EXPECT_EQ(ThrownCode([&] { v.RangeCheck(1225); }), VX_RANGE);
  EXPECT_EQ(ThrownCode([&] { v.Set(CBitVector::npos); }), VX_RANGE);
  EXPECT_EQ(ThrownCode([&] { v.SetBulk(CBitVector::npos - 1); }), VX_RANGE);
  EXPECT_EQ(ThrownCode([&] { v = std::vector<unsigned long>{1, 0x1'0000'0000ul}; }), VX_RANGE);
  ExpectMatches(v, {100, 120, 200}, 1225);
}

TEST(BitVector, ClearResizeAndVectorAssignmentKeepTheSize) {
  CBitVector v = Of({3, 70, 200});
  v.Clear();
  ExpectMatches(v, {}, 233);
  v = Of({3, 70, 200});
  v.Resize(70);
  ExpectMatches(v, {3});
  v.Resize(300);  // growing again must not bring dropped bits back
  EXPECT_EQ((~v).Count(), 299u);

  CBitVector w(std::vector<unsigned long>{5, 1, 99});
  ExpectMatches(w, {1, 5, 99}, 132);
  w.Resize(1000);
  w = std::vector<unsigned long>{7};
  ExpectMatches(w, {7}, 1000);
  std::vector<unsigned long> out{42};
  w.Convert(out);
  EXPECT_EQ(out, std::vector<unsigned long>{7});
}

TEST(BitVector, SetOperationsAgreeWithAModel) {
  std::mt19937 rng(7);
  for (int round = 0; round < 60; ++round) {
    // Sizes that differ, with and without a partial last word, from sparse to nearly full.
    uint32_t la = 1 + rng() % 700, lb = 1 + rng() % 700;
    Model ma, mb, both, either, minus, complement;
    CBitVector a = RandomSet(rng, la, rng() % (2 * la), ma);
    CBitVector b = RandomSet(rng, lb, rng() % (2 * lb), mb);
    for (uint32_t i = 0; i < std::max(la, lb); ++i) {
      if (ma.count(i) && mb.count(i)) both.insert(i);
      if (ma.count(i) || mb.count(i)) either.insert(i);
      if (ma.count(i) && !mb.count(i)) minus.insert(i);
      if (i < la && !ma.count(i)) complement.insert(i);
    }
    ExpectMatches(CBitVector(a) &= b, both, la);
    ExpectMatches(CBitVector(a) |= b, either, std::max(la, lb));
    ExpectMatches(CBitVector(a).AndNot(b), minus);
    ExpectMatches(~a, complement, la);
    EXPECT_TRUE(~~a == a);
    EXPECT_EQ(a == b, ma == mb);
  }
  CBitVector empty;
  empty.Resize(500);
  CBitVector t = Of({2, 90});
  ExpectMatches(t |= empty, {2, 90}, 500);
  EXPECT_TRUE(t == Of({2, 90}));  // equality ignores the sizes
  ExpectMatches(t &= CBitVector(), {});
  ExpectMatches(empty |= Of({2, 90}), {2, 90});
}

TEST(BitVector, WalksCountsAndIteratorsAgreeWithAModel) {
  std::mt19937 rng(11);
  for (int round = 0; round < 40; ++round) {
    uint32_t limit = 1 + rng() % 500;
    Model m;
    CBitVector v = RandomSet(rng, limit, rng() % 60, m);
    ExpectMatches(v, m);
    for (uint32_t i = 0; i < limit + 70; ++i) {
      auto next = m.lower_bound(i);
      EXPECT_EQ(v.NextSet(i), next == m.end() ? CBitVector::npos : *next) << i;
      auto after = m.upper_bound(i);
      EXPECT_EQ(v.PrevSet(i), after == m.begin() ? CBitVector::npos : *std::prev(after)) << i;
    }
    for (int k = 0; k < 50; ++k) {
      uint32_t from = rng() % (limit + 70), to = rng() % (limit + 70);
      auto expected = from < to ? std::distance(m.lower_bound(from), m.lower_bound(to)) : 0;
      EXPECT_EQ(v.Count(from, to), static_cast<uint32_t>(expected)) << from << ".." << to;
    }
    Model walked;
    for (uint32_t i : v) walked.insert(i);
    EXPECT_EQ(walked, m);
    uint32_t positions = 0;
    for (auto it = v.bits_begin(); it != v.bits_end(); ++it, ++positions) {
      EXPECT_EQ(*it, m.count(it.Index()) == 1);
    }
    EXPECT_EQ(positions, v.Size());
  }
}

TEST(BitVector, BufferIsLittleEndianBytesRoundedTo32Bits) {
  for (uint32_t bits : {0, 1, 32, 33, 64, 65}) {
    EXPECT_EQ(Of({}, bits).BufferSize(), (bits + 31) / 32 * 4) << bits;
  }
  const std::vector<uint8_t> bytes = {0x01, 0x02, 0x00, 0x80, 0x02, 0x00, 0x00, 0x00};
  CBitVector v = Of({0, 9, 31, 33}, 40);
  ASSERT_EQ(v.BufferSize(), bytes.size());
  EXPECT_EQ(std::vector<uint8_t>(v.Buffer(), v.Buffer() + 8), bytes);
  CBitVector w = Of({500});
  w.Assign(bytes.data(), 8);
  ExpectMatches(w, {0, 9, 31, 33}, 64);
}

}  // namespace
