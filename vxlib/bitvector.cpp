#include "bitvector.h"

#include <algorithm>
#include <bit>
#include <cstring>

#include "VXException.h"
#include "VXFile.h"
#include "VXResult.h"

static_assert(std::endian::native == std::endian::little,
              "Buffer() hands out the words as little-endian bytes");

namespace {

constexpr uint32_t kWordBits = 64;
// The largest size. npos marks "none" in both bounds, so the highest index must leave room for
// high_ = index + 1 below it.
constexpr uint64_t kMaxBits = CBitVector::npos - 1;

size_t WordsFor(uint64_t bits) { return static_cast<size_t>((bits + kWordBits - 1) / kWordBits); }

// Bits [bit % 64, 64) of a word.
uint64_t MaskFrom(uint32_t bit) { return ~uint64_t{0} << (bit % kWordBits); }
// Bits [0, bit % 64) of a word, or the whole word when bit is a multiple of 64.
uint64_t MaskBelow(uint32_t bit) {
  uint32_t r = bit % kWordBits;
  return r ? (uint64_t{1} << r) - 1 : ~uint64_t{0};
}

// The hardware popcount is not part of baseline x86-64; pick it at load time where present.
// Not under ThreadSanitizer: the resolver runs while the library is relocated, before the
// sanitizer's runtime is up, and its instrumented entry crashes there.
#if defined(__SANITIZE_THREAD__)
#define VX_NO_LOAD_TIME_DISPATCH 1
#elif defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define VX_NO_LOAD_TIME_DISPATCH 1
#endif
#endif
#if defined(__x86_64__) && defined(__ELF__) && !defined(VX_NO_LOAD_TIME_DISPATCH)
#define VX_POPCNT_CLONES [[gnu::target_clones("popcnt", "default")]]
#else
#define VX_POPCNT_CLONES
#endif

VX_POPCNT_CLONES uint32_t PopCount(const uint64_t* words, size_t n) {
  uint32_t count = 0;
  for (size_t w = 0; w < n; ++w) count += static_cast<uint32_t>(std::popcount(words[w]));
  return count;
}

}  // namespace

CBitVector::CBitVector(const std::vector<unsigned long>& indices) { *this = indices; }

// Keeps the size (growing it when an index needs more) and replaces the set.
CBitVector& CBitVector::operator=(const std::vector<unsigned long>& indices) {
  unsigned long top = 0;
  for (unsigned long i : indices) {
    if (i >= kMaxBits) VX_THROW(VX_RANGE);
    top = std::max(top, i);
  }
  Clear();
  if (indices.empty()) return *this;
  GrowToHold_(static_cast<uint32_t>(top), 33);
  for (unsigned long i : indices) words_[i / kWordBits] |= uint64_t{1} << (i % kWordBits);
  RecomputeBounds_();
  return *this;
}

CBitVector& CBitVector::operator&=(const CBitVector& other) {
  if (IsEmpty()) return *this;
  if (other.IsEmpty()) {
    Clear();
    return *this;
  }
  size_t first = low_ / kWordBits;
  size_t last = (high_ - 1) / kWordBits;
  size_t common = std::min(last + 1, other.words_.size());
  for (size_t w = first; w < common; ++w) words_[w] &= other.words_[w];
  for (size_t w = std::max(first, common); w <= last; ++w) words_[w] = 0;
  RecomputeBoundsWithin_();
  return *this;
}

CBitVector& CBitVector::operator|=(const CBitVector& other) {
  if (other.IsEmpty()) {
    Grow_(other.size_);
    return *this;
  }
  Grow_(other.size_);
  size_t last = (other.high_ - 1) / kWordBits;
  for (size_t w = other.low_ / kWordBits; w <= last; ++w) words_[w] |= other.words_[w];
  bool wasEmpty = IsEmpty();
  low_ = wasEmpty ? other.low_ : std::min(low_, other.low_);
  high_ = wasEmpty ? other.high_ : std::max(high_, other.high_);
  return *this;
}

CBitVector CBitVector::operator~() const {
  CBitVector result(*this);
  for (uint64_t& w : result.words_) w = ~w;
  if (!result.words_.empty()) result.words_.back() &= MaskBelow(size_);
  result.RecomputeBounds_();
  return result;
}

CBitVector& CBitVector::AndNot(const CBitVector& other) {
  if (IsEmpty() || other.IsEmpty()) return *this;
  size_t first = std::max(low_, other.low_) / kWordBits;
  size_t last = (std::min(high_, other.high_) - 1) / kWordBits;
  for (size_t w = first; w <= last; ++w) words_[w] &= ~other.words_[w];
  RecomputeBoundsWithin_();
  return *this;
}

bool CBitVector::operator==(const CBitVector& other) const {
  if (low_ != other.low_ || high_ != other.high_) return false;
  if (IsEmpty()) return true;
  auto first = words_.begin() + low_ / kWordBits;
  auto last = words_.begin() + (high_ - 1) / kWordBits + 1;
  return std::equal(first, last, other.words_.begin() + low_ / kWordBits);
}

void CBitVector::Set(uint32_t index, bool value) {
  if (!value) {
    if (!Get(index)) return;
    words_[index / kWordBits] &= ~(uint64_t{1} << (index % kWordBits));
    if (index == low_ || index + 1 == high_) RecomputeBoundsWithin_();
    return;
  }
  GrowToHold_(index, 33);
  words_[index / kWordBits] |= uint64_t{1} << (index % kWordBits);
  low_ = IsEmpty() ? index : std::min(low_, index);
  high_ = high_ == npos ? index + 1 : std::max(high_, index + 1);
}

// Bulk filters set many rising indices in a row; growing by a larger step keeps reallocation
// rare.
void CBitVector::SetBulk(uint32_t index) {
  GrowToHold_(index, 1025);
  Set(index);
}

bool CBitVector::Get(uint32_t index) const {
  return index < size_ && (words_[index / kWordBits] >> (index % kWordBits)) & 1u;
}

void CBitVector::Clear() {
  if (!IsEmpty()) {
    std::fill(words_.begin() + low_ / kWordBits, words_.begin() + (high_ - 1) / kWordBits + 1, 0);
  }
  low_ = high_ = npos;
}

void CBitVector::Resize(uint32_t bits) {
  bits = static_cast<uint32_t>(std::min<uint64_t>(bits, kMaxBits));
  if (bits >= size_) {
    Grow_(bits);
    return;
  }
  words_.resize(WordsFor(bits));
  if (!words_.empty()) words_.back() &= MaskBelow(bits);
  size_ = bits;
  if (!IsEmpty() && high_ > bits) RecomputeBounds_();
}

uint32_t CBitVector::Count() const { return IsEmpty() ? 0 : Count(low_, high_); }

uint32_t CBitVector::Count(uint32_t from, uint32_t to) const {
  if (IsEmpty()) return 0;
  from = std::max(from, low_);
  to = std::min(to, high_);
  if (from >= to) return 0;
  size_t first = from / kWordBits;
  size_t last = (to - 1) / kWordBits;
  if (first == last) {
    return std::popcount(words_[first] & MaskFrom(from) & MaskBelow(to));
  }
  uint32_t n = std::popcount(words_[first] & MaskFrom(from));
  n += PopCount(words_.data() + first + 1, last - first - 1);
  return n + std::popcount(words_[last] & MaskBelow(to));
}

uint32_t CBitVector::NextSet(uint32_t i) const {
  if (IsEmpty() || i >= high_) return npos;
  i = std::max(i, low_);
  size_t w = i / kWordBits;
  uint64_t bits = words_[w] & MaskFrom(i);
  while (bits == 0) bits = words_[++w];  // high_ bounds the walk: a set bit lies ahead
  return static_cast<uint32_t>(w * kWordBits + std::countr_zero(bits));
}

uint32_t CBitVector::PrevSet(uint32_t i) const {
  if (IsEmpty() || i < low_) return npos;
  i = std::min(i, high_ - 1);
  size_t w = i / kWordBits;
  uint64_t bits = words_[w] & MaskBelow(i + 1);
  while (bits == 0) bits = words_[--w];  // low_ bounds the walk: a set bit lies behind
  return static_cast<uint32_t>(w * kWordBits + 63 - std::countl_zero(bits));
}

namespace {

template <typename T>
void ConvertTo(const std::vector<uint64_t>& words, uint32_t low, uint32_t high, uint32_t count,
               std::vector<T>& out) {
  out.clear();
  if (low == CBitVector::npos) return;
  out.reserve(count);
  size_t last = (high - 1) / kWordBits;
  for (size_t w = low / kWordBits; w <= last; ++w) {
    for (uint64_t bits = words[w]; bits; bits &= bits - 1) {
      out.push_back(static_cast<T>(w * kWordBits + std::countr_zero(bits)));
    }
  }
}

}  // namespace

void CBitVector::Convert(std::vector<unsigned long>& out) const {
  ConvertTo(words_, low_, high_, Count(), out);
}

void CBitVector::Convert(std::vector<uint32_t>& out) const {
  ConvertTo(words_, low_, high_, Count(), out);
}

void CBitVector::Assign(const uint8_t* data, uint32_t bytes) {
  uint64_t bits = std::min<uint64_t>(uint64_t{bytes} * 8, kMaxBits);
  std::vector<uint64_t> words(WordsFor(bits), 0);
  if (bytes) std::memcpy(words.data(), data, static_cast<size_t>((bits + 7) / 8));
  if (!words.empty()) words.back() &= MaskBelow(static_cast<uint32_t>(bits));
  words_ = std::move(words);
  size_ = static_cast<uint32_t>(bits);
  RecomputeBounds_();
}

void CBitVector::RangeCheck(uint32_t index) const {
  if (index >= size_) VX_THROW(VX_RANGE);
}

void CBitVector::GrowToHold_(uint32_t index, uint32_t spare) {
  if (index < size_) return;
  if (index >= kMaxBits) VX_THROW(VX_RANGE);
  Grow_(static_cast<uint32_t>(std::min<uint64_t>(uint64_t{index} + spare, kMaxBits)));
}

void CBitVector::Grow_(uint32_t bits) {
  if (bits <= size_) return;
  words_.resize(WordsFor(bits), 0);
  size_ = bits;
}

void CBitVector::RecomputeBounds_() { FindBounds_(0, words_.size()); }

// Clearing bits can only move the bounds inward.
void CBitVector::RecomputeBoundsWithin_() {
  if (!IsEmpty()) FindBounds_(low_ / kWordBits, (high_ - 1) / kWordBits + 1);
}

// Callers pass the words that may hold set bits; all others must be zero.
void CBitVector::FindBounds_(size_t from, size_t to) {
  size_t lw = from;
  while (lw < to && words_[lw] == 0) ++lw;
  if (lw == to) {
    low_ = high_ = npos;
    return;
  }
  size_t hw = to - 1;
  while (words_[hw] == 0) --hw;
  low_ = static_cast<uint32_t>(lw * kWordBits + std::countr_zero(words_[lw]));
  high_ = static_cast<uint32_t>(hw * kWordBits + kWordBits - std::countl_zero(words_[hw]));
}

CVXFile& CVXFile::operator<<(const CBitVector& bits) {
  uint32_t bytes = bits.BufferSize();
  *this << bytes;
  Write(bits.Buffer(), bytes);
  return *this;
}

// The target changes only once the whole buffer has been read.
CVXFile& CVXFile::operator>>(CBitVector& bits) {
  uint32_t bytes = 0;
  *this >> bytes;
  // More bytes than any bit set can hold is a corrupt count.
  if (bytes > (kMaxBits + 31) / 32 * 4) VX_THROW(VX_NOT_FOUND);
  std::vector<uint8_t> data = ReadBytes(bytes);
  bits.Assign(data.data(), bytes);
  return *this;
}
