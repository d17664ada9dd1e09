#include "VXCatFile.h"

#include <cstring>
#include <ctime>
#include <utility>
#include <vector>

#include "VXException.h"
#include "VXFile.h"
#include "VXResult.h"
#include "xstring.h"

namespace {

constexpr uint16_t kObjectVersion = 1;
constexpr uint16_t kFileRecordVersion = 3;

// Both directions of the 66-byte block walk the fields in one order; `io` is a write or a read.
template <typename Data, typename Io>
void Block(Data& d, Io io) {
  io(d.Folder);
  io(d.Width);
  io(d.Height);
  io(d.Size);
  io(d.Format);
  io(d.CRC);
  io(d.Processed);
  io(d.FileTime);
  io(d.Flags);
  io(d.Reserved1);
  io(d.EmbeddedTime);
  io(d.OriginalFile);
  io(d.VersionTag);
  for (auto& b : d.Reserved4) io(b);
}

// Decodes little-endian fields from bytes already read. Loading a catalog reads a million of
// these records; one Read for the block instead of one per field halves the parse time.
struct ByteCursor {
  const uint8_t* at;
  template <typename T>
  void operator()(T& v) {
    std::memcpy(&v, at, sizeof v);
    at += sizeof v;
  }
};

// A catalog load reads a million names; a short one goes straight into the string instead of
// through the stream's temporary vector. A long one takes the stream's path, whose allocation
// grows only with the bytes that are really there.
void ReadName(CVXFile& file, std::string& name) {
  constexpr uint32_t kShortName = 4096;
  uint32_t length = 0;
  file >> length;
  if (length > kShortName || length > file.Remaining()) {
    std::vector<uint8_t> bytes = file.ReadBytes(length);
    name.assign(bytes.begin(), bytes.end());
    return;
  }
  name.resize(length);
  file.Read(name.data(), length);
}

}  // namespace

CVXCatFile::CVXCatFile() : CVXCatFile(0, std::string(), 0) {}

CVXCatFile::CVXCatFile(uint32_t oid, const char* name, uint32_t folderOid)
    : CVXCatFile(oid, std::string(name ? name : ""), folderOid) {}

CVXCatFile::CVXCatFile(uint32_t oid, const std::string& name, uint32_t folderOid)
    : CVXDBObject(oid) {
  data_.Name = name;
  data_.Folder = folderOid;
  data_.Processed = data_.FileTime = static_cast<int32_t>(std::time(nullptr));
}

int32_t CVXCatFile::SortTime() const {
  bool embedded = (data_.Flags & cfEmbeddedTimeValid) != 0 && data_.EmbeddedTime != 0;
  return embedded ? data_.EmbeddedTime : data_.FileTime;
}

int CVXCatFile::CompareNames(const std::string& a, const std::string& b) {
  return xstring_comparenocase(a, b);
}

bool CVXCatFile::operator<(const CVXCatFile& other) const {
  return CompareNames(data_.Name, other.data_.Name) < 0;
}

bool CVXCatFile::operator==(const CVXCatFile& other) const {
  return data_.Folder == other.data_.Folder && *this == other.data_.Name;
}

bool CVXCatFile::operator==(const std::string& name) const {
  return CompareNames(data_.Name, name) == 0;
}

void CVXCatFile::Write(CVXFile& file) const {
  file << kObjectVersion << Oid() << kFileRecordVersion << data_.Name;
  Block(data_, [&](auto v) { file << v; });
}

void CVXCatFile::Read(CVXFile& file) {
  // Both versions are ignored: there has only ever been one layout.
  uint8_t head[8], block[kBlockBytes];
  SData d;
  file.Read(head, sizeof head);
  ReadName(file, d.Name);
  file.Read(block, sizeof block);
  uint32_t oid = 0;
  std::memcpy(&oid, head + 2, sizeof oid);
  Block(d, ByteCursor{block});
  Oid() = oid;
  data_ = std::move(d);
}

CVXCatFile::CVXCatFile(const uint8_t*& at, const uint8_t* end) {
  const uint8_t* next = at;
  auto take = [&](size_t bytes) {
    if (static_cast<size_t>(end - next) < bytes) VX_THROW(VX_NOT_FOUND);
    const uint8_t* start = next;
    next += bytes;
    return start;
  };
  // Both versions are ignored, as in Read.
  const uint8_t* head = take(8 + sizeof(uint32_t));
  uint32_t length = 0;
  std::memcpy(&Oid(), head + 2, sizeof(uint32_t));
  std::memcpy(&length, head + 8, sizeof length);
  const uint8_t* name = take(length);
  const uint8_t* block = take(kBlockBytes);
  data_.Name.assign(reinterpret_cast<const char*>(name), length);
  Block(data_, ByteCursor{block});
  at = next;
}

CVXFile& operator<<(CVXFile& file, const CVXCatFile& catFile) {
  catFile.Write(file);
  return file;
}

CVXFile& operator>>(CVXFile& file, CVXCatFile& catFile) {
  catFile.Read(file);
  return file;
}
