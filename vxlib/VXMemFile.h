#pragma once

#include <cstdint>
#include <vector>

#include "VXFile.h"

// A growable memory buffer read and written as a CVXFile. Every record of the stores is built in
// one and stored with a single Set, and read back from one filled by a single Get.
//
// Invariant: position <= size <= buffer capacity. Writes go at the position and extend the size;
// reads stop at the size and throw 10020 if asked for more.
class CVXMemFile : public CVXFile {
 public:
  CVXMemFile() : CVXMemFile(false, 0, 4096) {}
  CVXMemFile(bool flag, size_t initialSize, size_t growBy);
  // Wraps a copy of existing bytes for reading.
  CVXMemFile(const void* data, size_t size);
  CVXMemFile(const CVXMemFile&) = default;
  CVXMemFile& operator=(const CVXMemFile&) = default;
  ~CVXMemFile() override = default;

  // Grows the buffer to at least `size` bytes and makes exactly `size` bytes the readable
  // content; the position is kept (clamped to the new size).
  uint8_t* GetBuffer(size_t size);
  const uint8_t* GetBuffer() const { return buffer_.data(); }
  // Bytes of content (written, or set by GetBuffer(size)).
  uint64_t GetFileSize() const { return size_; }
  void Rewind() { position_ = 0; }
  uint64_t GetPosition() const { return position_; }
  // Moves the position; throws 10020 beyond the content.
  void Seek(uint64_t position);
  // Drops all content.
  void Clear() { size_ = position_ = 0; }
  uint64_t Remaining() const override { return size_ - position_; }

 protected:
  void WriteRaw(const void* buffer, size_t size) override;
  void ReadRaw(void* buffer, size_t size) override;

 private:
  void Reserve_(size_t size);

  std::vector<uint8_t> buffer_;
  size_t size_ = 0;
  size_t position_ = 0;
  size_t growBy_ = 4096;
};

// A memory file inside another file: a 32-bit byte count, then the bytes.
CVXFile& operator<<(CVXFile& file, const CVXMemFile& mem);
CVXFile& operator>>(CVXFile& file, CVXMemFile& mem);
