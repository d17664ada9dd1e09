#include "VXCatFile.h"

#include <ctime>
#include <utility>

#include "VXFile.h"
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
  uint16_t objectVersion = 0, recordVersion = 0;
  uint32_t oid = 0;
  SData d;
  file >> objectVersion >> oid >> recordVersion >> d.Name;
  Block(d, [&](auto& v) { file >> v; });
  Oid() = oid;
  data_ = std::move(d);
}

CVXFile& operator<<(CVXFile& file, const CVXCatFile& catFile) {
  catFile.Write(file);
  return file;
}

CVXFile& operator>>(CVXFile& file, CVXCatFile& catFile) {
  catFile.Read(file);
  return file;
}
