#include "VXBitmap.h"

#include <cstring>
#include <limits>
#include <new>
#include <utility>

#include "VXResult.h"

CVXBitmap::CVXBitmap(uint32_t width, uint32_t height) {
  if (uint64_t{width} * height > 0 && Create(width, height) != VX_OK) throw std::bad_alloc();
}

CVXBitmap::CVXBitmap(const CVXBitmap& other) : CVXBase(other) {
  if (other.data_ && Create(other.width_, other.height_, false, other.data_) != VX_OK) {
    throw std::bad_alloc();
  }
  flags_ = other.flags_;
}

CVXBitmap::CVXBitmap(CVXBitmap&& other) noexcept
    : width_(std::exchange(other.width_, 0)),
      height_(std::exchange(other.height_, 0)),
      flags_(std::exchange(other.flags_, 0)),
      data_(std::exchange(other.data_, nullptr)) {}

CVXBitmap& CVXBitmap::operator=(const CVXBitmap& other) {
  if (this != &other) {
    CVXBitmap copy(other);
    *this = std::move(copy);
  }
  return *this;
}

CVXBitmap& CVXBitmap::operator=(CVXBitmap&& other) noexcept {
  if (this != &other) {
    Free();
    width_ = std::exchange(other.width_, 0);
    height_ = std::exchange(other.height_, 0);
    flags_ = std::exchange(other.flags_, 0);
    data_ = std::exchange(other.data_, nullptr);
  }
  return *this;
}

CVXBitmap::~CVXBitmap() { delete[] data_; }

void CVXBitmap::SetGrayScale(bool grayScale) {
  flags_ = grayScale ? (flags_ | kGrayScale) : (flags_ & ~uint32_t{kGrayScale});
}

unsigned CVXBitmap::Create(uint32_t width, uint32_t height, bool grayScale, const void* source) {
  Free();
  const uint64_t pixels = uint64_t{width} * height;
  if (pixels == 0) {
    SetGrayScale(grayScale);
    return VX_OK;
  }
  // The byte size must be representable before anything is allocated.
  if (pixels > std::numeric_limits<size_t>::max() / sizeof(SVXColor)) return VX_NEUTRAL_FAILURE;
  data_ = new (std::nothrow) SVXColor[pixels];
  if (!data_) return VX_NEUTRAL_FAILURE;
  if (source) {
    std::memcpy(data_, source, pixels * sizeof(SVXColor));
  } else {
    std::memset(data_, 0, pixels * sizeof(SVXColor));
  }
  width_ = width;
  height_ = height;
  SetGrayScale(grayScale);
  return VX_OK;
}

void CVXBitmap::Free() {
  delete[] data_;
  data_ = nullptr;
  width_ = height_ = flags_ = 0;
}
