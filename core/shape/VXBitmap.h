#pragma once

#include <cstddef>
#include <cstdint>

#include "VXBase.h"
#include "VXColor.h"

// A pixel buffer handed in by the host: Width * Height SVXColor values, rows from the top, no
// row padding. The bitmap owns its pixels; copies are deep. Invariant: the pixel pointer is null
// exactly when Width * Height is 0.
class CVXBitmap : public CVXBase {
 public:
  enum : uint32_t { kGrayScale = 0x0001 };  // bit of Flags

  CVXBitmap() = default;
  // Allocates cleared pixels when width * height is positive; throws std::bad_alloc when the
  // host cannot hold them.
  CVXBitmap(uint32_t width, uint32_t height);
  CVXBitmap(const CVXBitmap& other);
  CVXBitmap(CVXBitmap&& other) noexcept;
  CVXBitmap& operator=(const CVXBitmap& other);
  CVXBitmap& operator=(CVXBitmap&& other) noexcept;
  ~CVXBitmap() override;

  uint32_t GetWidth() const { return width_; }
  uint32_t GetHeight() const { return height_; }
  uint32_t GetFlags() const { return flags_; }
  uint64_t GetPixelCount() const { return data_ ? uint64_t{width_} * height_ : 0; }

  unsigned char* GetData() { return reinterpret_cast<unsigned char*>(data_); }
  const unsigned char* GetData() const { return reinterpret_cast<const unsigned char*>(data_); }
  // 4 * Width * Height, 0 without pixels.
  size_t GetDataSize() const { return static_cast<size_t>(GetPixelCount() * 4); }
  // 4 * Width, 0 without pixels.
  size_t GetBytesPerRow() const { return data_ ? size_t{width_} * 4 : 0; }
  SVXColor* GetColorMatrix() { return data_; }
  const SVXColor* GetColorMatrix() const { return data_; }

  bool IsGrayScale() const { return (flags_ & kGrayScale) != 0; }
  void SetGrayScale(bool grayScale);

  // Replaces the pixels by width * height new ones, copied from `source` (4 bytes a pixel) when
  // it is given and cleared otherwise. Returns 10001, with an empty bitmap when the product is 0;
  // 10000 when the pixels cannot be allocated, the bitmap is then empty.
  unsigned Create(uint32_t width, uint32_t height, bool grayScale = false,
                  const void* source = nullptr);
  // Back to the empty bitmap: no pixels, size and flags 0.
  void Free();

 private:
  uint32_t width_ = 0;
  uint32_t height_ = 0;
  uint32_t flags_ = 0;
  SVXColor* data_ = nullptr;  // owned, new[]
};
