#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "VXDBObject.h"
#include "VXURI.h"

class CVXFile;

// A folder of the catalog: its location, its place in the folder tree, the files directly in it
// and what the host keeps about its medium. The catalog holds one per folder and hands out
// copies. Children and Files hold no duplicates as long as they are changed through AddChild and
// AddFile.
class CVXFolder : public CVXDBObject {
 public:
  struct SData {
    bool MayBeOffline = false;  // the medium may be absent
    std::string MediaID;        // volume label
    std::string MediaSerial;    // volume serial as text
    std::string Comment;
    bool IsDBRelative = false;  // the path is relative to the database's location
    CVXURI URI;                 // IsFolder is true
    uint32_t ParentFolder = 0;  // 0 for a root
    std::vector<uint32_t> Children;
    std::vector<uint32_t> Files;
    uint32_t Thumbnail = 0;  // OID of the file that represents the folder
    int32_t LastUpdate = 0;  // seconds since 1970: last change of the lists
    bool HasCredentials = false;
    char Credential1[128] = {};  // the host's; stored only when HasCredentials
    char Credential2[128] = {};
    std::string Proxy;
    uint32_t ProxyPort = 0;
    std::string FriendlyName;  // empty: LastName of the URI is shown
    uint32_t Flags = 0;
    uint32_t LastActiveOid = 0;
    int32_t ThumbSize = 0;
  };
  static constexpr uint16_t kRecordVersion = 6;

  // Constructors stamp LastUpdate with the current time; the copy copies it.
  explicit CVXFolder(uint32_t oid = 0);
  CVXFolder(const CVXURI& uri, uint32_t oid, uint32_t parentOid);
  CVXFolder(const CVXFolder&) = default;
  CVXFolder& operator=(const CVXFolder&) = default;
  ~CVXFolder() override = default;

  bool MayBeOffline() const { return data_.MayBeOffline; }
  bool& MayBeOffline() { return data_.MayBeOffline; }
  const std::string& MediaID() const { return data_.MediaID; }
  std::string& MediaID() { return data_.MediaID; }
  const std::string& MediaSerial() const { return data_.MediaSerial; }
  std::string& MediaSerial() { return data_.MediaSerial; }
  const std::string& Comment() const { return data_.Comment; }
  std::string& Comment() { return data_.Comment; }
  bool IsDBRelative() const { return data_.IsDBRelative; }
  bool& IsDBRelative() { return data_.IsDBRelative; }
  const CVXURI& URI() const { return data_.URI; }
  CVXURI& URI() { return data_.URI; }
  uint32_t ParentFolder() const { return data_.ParentFolder; }
  uint32_t& ParentFolder() { return data_.ParentFolder; }
  const std::vector<uint32_t>& Children() const { return data_.Children; }
  std::vector<uint32_t>& Children() { return data_.Children; }
  const std::vector<uint32_t>& Files() const { return data_.Files; }
  std::vector<uint32_t>& Files() { return data_.Files; }
  uint32_t Thumbnail() const { return data_.Thumbnail; }
  uint32_t& Thumbnail() { return data_.Thumbnail; }
  int32_t LastUpdate() const { return data_.LastUpdate; }
  int32_t& LastUpdate() { return data_.LastUpdate; }
  uint32_t Flags() const { return data_.Flags; }
  uint32_t& Flags() { return data_.Flags; }
  uint32_t LastActiveOid() const { return data_.LastActiveOid; }
  uint32_t& LastActiveOid() { return data_.LastActiveOid; }
  int32_t ThumbSize() const { return data_.ThumbSize; }
  int32_t& ThumbSize() { return data_.ThumbSize; }

  // The stored name, or the URI's last component when none was given.
  std::string FriendlyName() const;
  // An empty name restores the default.
  void SetFriendlyName(const std::string& name) { data_.FriendlyName = name; }
  // MediaSerial (decimal, or hexadecimal with "0x") as "HIGH-LOW" in hex 16-bit halves, the
  // way the volume serial is shown: "3735928559" gives "DEAD-BEEF", "" gives "0-0".
  std::string MediaSerialWindows() const;

  // Each change of a list runs Touch(); a call that changes nothing does not. Adding the first
  // file makes it the Thumbnail; removing the Thumbnail passes it to the first remaining file.
  void AddChild(uint32_t oid);
  void RemoveChild(uint32_t oid);
  void AddFile(uint32_t oid);
  void RemoveFile(uint32_t oid);
  void Touch();

  // As CVXURI::operator< on the two URIs.
  bool operator<(const CVXFolder& other) const { return data_.URI < other.data_.URI; }

  // The folder record (blob type 2), written as version 6. Read accepts every older version; a
  // truncated or corrupt record throws CVXException* (10020) and leaves this object unchanged.
  void Write(CVXFile& file) const;
  void Read(CVXFile& file);

 protected:
  SData& Properties() { return data_; }
  const SData& Properties() const { return data_; }

 private:
  SData data_;
};

// For the catalog's store only.
CVXFile& operator<<(CVXFile& file, const CVXFolder& folder);
CVXFile& operator>>(CVXFile& file, CVXFolder& folder);
