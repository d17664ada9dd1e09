#pragma once

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <vector>

// A growable set of unsigned 32-bit indices (sets of OIDs), stored as bits in 64-bit words.
//
// Invariants: bits at or beyond Size() are zero; low_ is the lowest set index and high_ the
// highest set index plus 1, both npos when the set is empty (so an empty set never walks its
// words). Setting an index at or beyond Size() grows the set first with room to spare: to
// index + 33 bits in plain use (Set), to index + 1025 in bulk filling (SetBulk).
class CBitVector {
 public:
  static constexpr uint32_t npos = 0xFFFFFFFFu;

  CBitVector() = default;
  CBitVector(const CBitVector&) = default;
  CBitVector(CBitVector&&) noexcept = default;
  explicit CBitVector(const std::vector<unsigned long>& indices);
  CBitVector& operator=(const CBitVector&) = default;
  CBitVector& operator=(CBitVector&&) noexcept = default;
  CBitVector& operator=(const std::vector<unsigned long>& indices);

  // Set operations. &= and |= work on sets of any two sizes: |= grows to the larger size, &=
  // keeps the left size. ~ complements every bit below Size().
  CBitVector& operator&=(const CBitVector& other);
  CBitVector& operator|=(const CBitVector& other);
  CBitVector operator~() const;
  // this AND NOT other.
  CBitVector& AndNot(const CBitVector& other);
  bool operator==(const CBitVector& other) const;  // same set, whatever the sizes

  // Setting an index at or beyond npos - 1 throws a CVXException (10090); resetting an index
  // beyond Size() does nothing.
  void Set(uint32_t index, bool value = true);
  void SetBulk(uint32_t index);
  void Reset(uint32_t index) { Set(index, false); }
  bool Get(uint32_t index) const;
  bool operator[](uint32_t index) const { return Get(index); }
  // Zeroes every bit and resets both bounds; the size stays.
  void Clear();
  // Sets the size in bits (at most npos - 1); shrinking drops the bits beyond it.
  void Resize(uint32_t bits);

  uint32_t Size() const { return size_; }
  bool IsEmpty() const { return low_ == npos; }
  uint32_t Low() const { return low_; }    // lowest set index, npos if empty
  uint32_t High() const { return high_; }  // highest set index + 1, npos if empty
  // Number of set bits; in [from, to) for the two-argument form.
  uint32_t Count() const;
  uint32_t Count(uint32_t from, uint32_t to) const;
  // First set index >= i, or npos. Last set index <= i, or npos.
  uint32_t NextSet(uint32_t i) const;
  uint32_t PrevSet(uint32_t i) const;
  // The set indices in rising order (the vector is replaced).
  void Convert(std::vector<unsigned long>& out) const;
  void Convert(std::vector<uint32_t>& out) const;

  // Bytes of the stored form: Size() rounded up to 32 bits, over 8.
  uint32_t BufferSize() const { return static_cast<uint32_t>((uint64_t{size_} + 31) / 32 * 4); }
  // The bits as little-endian bytes; BufferSize() of them are meaningful.
  const uint8_t* Buffer() const { return reinterpret_cast<const uint8_t*>(words_.data()); }
  // Replaces the content with `bytes` bytes of bits (Size() becomes bytes * 8).
  void Assign(const uint8_t* data, uint32_t bytes);
  // Throws a CVXException (10090) if index >= Size().
  void RangeCheck(uint32_t index) const;

  // Every position below Size(), each dereferencing to whether its bit is set.
  class iterator {
   public:
    using iterator_category = std::forward_iterator_tag;
    using value_type = bool;
    using difference_type = std::ptrdiff_t;
    using pointer = void;
    using reference = bool;
    iterator() = default;
    iterator(const CBitVector* v, uint32_t i) : v_(v), i_(i) {}
    bool operator*() const { return v_->Get(i_); }
    uint32_t Index() const { return i_; }
    iterator& operator++() {
      ++i_;
      return *this;
    }
    iterator operator++(int) {
      iterator t = *this;
      ++i_;
      return t;
    }
    bool operator==(const iterator& o) const { return i_ == o.i_; }

   private:
    const CBitVector* v_ = nullptr;
    uint32_t i_ = 0;
  };
  // The set indices in rising order.
  class set_iterator {
   public:
    using iterator_category = std::forward_iterator_tag;
    using value_type = uint32_t;
    using difference_type = std::ptrdiff_t;
    using pointer = void;
    using reference = uint32_t;
    set_iterator() = default;
    set_iterator(const CBitVector* v, uint32_t i) : v_(v), i_(i) {}
    uint32_t operator*() const { return i_; }
    set_iterator& operator++() {
      i_ = i_ == npos ? npos : v_->NextSet(i_ + 1);
      return *this;
    }
    set_iterator operator++(int) {
      set_iterator t = *this;
      ++*this;
      return t;
    }
    bool operator==(const set_iterator& o) const { return i_ == o.i_; }

   private:
    const CBitVector* v_ = nullptr;
    uint32_t i_ = npos;
  };

  iterator bits_begin() const { return iterator(this, 0); }
  iterator bits_end() const { return iterator(this, size_); }
  // Range-for over a CBitVector walks its set indices.
  set_iterator begin() const { return set_iterator(this, low_ == npos ? npos : low_); }
  set_iterator end() const { return set_iterator(this, npos); }

 private:
  // Grows to index + spare bits (at most npos - 1) if index is beyond the size; throws 10090
  // for an index that no size can hold.
  void GrowToHold_(uint32_t index, uint32_t spare);
  void Grow_(uint32_t bits);
  void RecomputeBounds_();
  void RecomputeBoundsWithin_();
  void FindBounds_(size_t fromWord, size_t toWord);

  std::vector<uint64_t> words_;
  uint32_t size_ = 0;
  uint32_t low_ = npos;
  uint32_t high_ = npos;
};
