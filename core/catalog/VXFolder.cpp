#include "VXFolder.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <utility>

#include "VXException.h"
#include "VXFile.h"
#include "VXResult.h"

namespace {

constexpr uint16_t kObjectVersion = 1;

// Bools are stored as one byte; any value but 0 reads as true.
bool ReadBool(CVXFile& file) {
  uint8_t b = 0;
  file >> b;
  return b != 0;
}

void WriteOids(CVXFile& file, const std::vector<uint32_t>& oids) {
  file << static_cast<uint32_t>(oids.size());
  if (!oids.empty()) file.Write(oids.data(), oids.size() * sizeof(uint32_t));
}

// The count is checked against what is left before the vector is sized for it.
std::vector<uint32_t> ReadOids(CVXFile& file) {
  uint32_t count = 0;
  file >> count;
  if (uint64_t{count} * sizeof(uint32_t) > file.Remaining()) VX_THROW(VX_NOT_FOUND);
  std::vector<uint32_t> oids(count);
  if (count > 0) file.Read(oids.data(), oids.size() * sizeof(uint32_t));
  return oids;
}

// strtoul with base 0 on a 32-bit unsigned long: out of range gives 0xFFFFFFFF, and a minus
// sign negates modulo 2^32.
uint32_t ParseSerial32(const std::string& text) {
  const char* p = text.c_str();
  while (*p == ' ' || (*p >= '\t' && *p <= '\r')) ++p;
  bool negative = *p == '-';
  if (*p == '-' || *p == '+') ++p;
  if (*p == '-' || *p == '+') return 0;  // strtoull would accept a second sign; strtoul not
  errno = 0;
  unsigned long long v = std::strtoull(p, nullptr, 0);
  if (errno == ERANGE || v > UINT32_MAX) return UINT32_MAX;
  return negative ? static_cast<uint32_t>(0u - static_cast<uint32_t>(v)) : static_cast<uint32_t>(v);
}

}  // namespace

CVXFolder::CVXFolder(uint32_t oid) : CVXDBObject(oid) {
  data_.LastUpdate = static_cast<int32_t>(std::time(nullptr));
}

CVXFolder::CVXFolder(const CVXURI& uri, uint32_t oid, uint32_t parentOid) : CVXFolder(oid) {
  data_.URI = uri;
  data_.ParentFolder = parentOid;
}

std::string CVXFolder::FriendlyName() const {
  return data_.FriendlyName.empty() ? data_.URI.LastName() : data_.FriendlyName;
}

std::string CVXFolder::MediaSerialWindows() const {
  uint32_t v = ParseSerial32(data_.MediaSerial);
  char out[16];
  std::snprintf(out, sizeof out, "%X-%X", v >> 16, v & 0xFFFFu);
  return out;
}

void CVXFolder::Touch() { data_.LastUpdate = static_cast<int32_t>(std::time(nullptr)); }

void CVXFolder::AddChild(uint32_t oid) {
  auto& c = data_.Children;
  if (std::find(c.begin(), c.end(), oid) != c.end()) return;
  c.push_back(oid);
  Touch();
}

void CVXFolder::RemoveChild(uint32_t oid) {
  auto& c = data_.Children;
  auto it = std::find(c.begin(), c.end(), oid);
  if (it == c.end()) return;
  c.erase(it);
  Touch();
}

void CVXFolder::AddFile(uint32_t oid) {
  auto& f = data_.Files;
  if (std::find(f.begin(), f.end(), oid) != f.end()) return;
  f.push_back(oid);
  if (data_.Thumbnail == 0) data_.Thumbnail = oid;
  Touch();
}

void CVXFolder::RemoveFile(uint32_t oid) {
  auto& f = data_.Files;
  auto it = std::find(f.begin(), f.end(), oid);
  if (it == f.end()) return;
  f.erase(it);
  if (data_.Thumbnail == oid) data_.Thumbnail = f.empty() ? 0 : f.front();
  Touch();
}

void CVXFolder::Write(CVXFile& file) const {
  const SData& d = data_;
  file << kObjectVersion << Oid() << kRecordVersion << d.LastUpdate << uint8_t{d.MayBeOffline}
       << d.MediaID << d.MediaSerial << d.Comment << uint8_t{d.IsDBRelative}
       << static_cast<uint32_t>(d.URI.Type()) << uint8_t{d.URI.IsFolder()} << d.URI.AsString()
       << d.ParentFolder << d.Thumbnail;
  WriteOids(file, d.Children);
  WriteOids(file, d.Files);
  file << uint8_t{d.HasCredentials};
  if (d.HasCredentials) {
    file.Write(d.Credential1, sizeof d.Credential1);
    file.Write(d.Credential2, sizeof d.Credential2);
  }
  file << d.Proxy << d.ProxyPort << d.FriendlyName << d.Flags << d.LastActiveOid << d.ThumbSize;
}

void CVXFolder::Read(CVXFile& file) {
  uint16_t objectVersion = 0, version = 0;
  uint32_t oid = 0, type = 0;
  SData d;
  file >> objectVersion >> oid >> version >> d.LastUpdate;
  d.MayBeOffline = ReadBool(file);
  file >> d.MediaID >> d.MediaSerial >> d.Comment;
  d.IsDBRelative = ReadBool(file);
  // Type and flag come from the record as they are; Set would normalise the text again.
  file >> type;
  d.URI.type_ = static_cast<CVXURI::EType>(type);
  d.URI.isFolder_ = ReadBool(file);
  file >> d.URI.text_ >> d.ParentFolder >> d.Thumbnail;
  d.Children = ReadOids(file);
  d.Files = ReadOids(file);
  d.HasCredentials = ReadBool(file);
  if (d.HasCredentials) {
    file.Read(d.Credential1, sizeof d.Credential1);
    file.Read(d.Credential2, sizeof d.Credential2);
  }
  file >> d.Proxy >> d.ProxyPort;
  if (version >= 4) file >> d.FriendlyName;
  if (version >= 5) file >> d.Flags;
  if (version >= 6) file >> d.LastActiveOid >> d.ThumbSize;
  Oid() = oid;
  data_ = std::move(d);
}

CVXFile& operator<<(CVXFile& file, const CVXFolder& folder) {
  folder.Write(file);
  return file;
}

CVXFile& operator>>(CVXFile& file, CVXFolder& folder) {
  folder.Read(file);
  return file;
}
