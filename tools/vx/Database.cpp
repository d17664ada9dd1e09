#include "Database.h"

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <system_error>

namespace vx {

namespace fs = std::filesystem;

const std::vector<PropertyColumn>& ImagePropertyColumns() {
  static const std::vector<PropertyColumn> kColumns = {
      {"Make", vptString},         {"Model", vptString},         {"Lens", vptString},
      {"Software", vptString},     {"Artist", vptString},        {"Copyright", vptString},
      {"Title", vptString},        {"Description", vptLongText}, {"DateTaken", vptDate},
      {"ExposureTime", vptDouble}, {"Exposure", vptString},      {"Aperture", vptDouble},
      {"ISO", vptUInt32},          {"FocalLength", vptDouble},   {"Orientation", vptInt32},
      {"Latitude", vptDouble},     {"Longitude", vptDouble},     {"Rating", vptInt32},
      {"Label", vptString},        {"Keywords", vptLongText},    {"City", vptString},
      {"State", vptString},        {"Country", vptString},
  };
  return kColumns;
}

Database::~Database() { Close(); }

bool Database::Create(const std::string& path, uint32_t thumbSide, uint32_t thumbQuality,
                      bool overwrite) {
  std::error_code ec;
  if (!overwrite && fs::exists(path, ec)) {
    std::fprintf(stderr, "vx: %s exists already (--force replaces it)\n", path.c_str());
    return false;
  }
  SVXCreateInfo info;
  info.Name = path;
  info.ThumbInfo.Width = info.ThumbInfo.Height = thumbSide;
  info.ThumbInfo.Depth = 24;
  info.ThumbInfo.Quality = thumbQuality;
  info.ThumbInfo.Version = 1;
  if (unsigned rc = engine_.Create(info); rc != VX_OK) {
    std::fprintf(stderr, "vx: cannot create %s (error %u)\n", path.c_str(), rc);
    return false;
  }
  CVXTable table;
  return EnsurePropertyTable(&table);
}

uint32_t Database::DecodeSide() {
  const SVXThumbInfoNew info = engine_.GetThumbInfo();
  return std::clamp<uint32_t>(std::max(info.Width, info.Height), 256, 1024);
}

bool Database::Open(const std::string& path, bool readOnly) {
  std::error_code ec;
  if (!fs::is_regular_file(path, ec)) {
    std::fprintf(stderr, "vx: %s is not a database\n", path.c_str());
    return false;
  }
  SVXCreateInfo info;
  info.Name = path;
  info.ReadOnly = readOnly;
  if (unsigned rc = engine_.Open(info); rc != VX_OK) {
    std::fprintf(stderr, "vx: cannot open %s (error %u%s)\n", path.c_str(), rc,
                 rc == 10211 ? ": in use by another process" : "");
    return false;
  }
  return true;
}

void Database::Close() {
  if (engine_.IsOpen()) engine_.Close();
}

bool Database::EnsurePropertyTable(CVXTable* table) {
  *table = CVXTable(VX_IMAGE_PROPERTIES_TABLE);
  if (engine_.GetImagePropertiesTable(*table) != VX_OK) {
    std::fprintf(stderr, "vx: the image property table is missing\n");
    return false;
  }
  bool added = false;
  for (const PropertyColumn& column : ImagePropertyColumns()) {
    if (table->FindColumn(column.name) != 0) continue;
    table->AddColumn(column.name, column.type);
    added = true;
  }
  if (!added || engine_.IsReadOnly()) return true;
  if (unsigned rc = engine_.GetPropertyDatabase().SetTable(*table); rc != VX_OK) {
    std::fprintf(stderr, "vx: cannot define the image property table (error %u)\n", rc);
    return false;
  }
  return engine_.GetImagePropertiesTable(*table) == VX_OK;
}

std::string Database::FilePath(uint32_t oid) {
  CVXURI uri;
  if (engine_.GetFileURI(oid, uri) != VX_OK) return std::string();
  return uri.NoProtocol();
}

uint32_t Database::FindFile(const std::string& nameOrOid) {
  uint32_t oid = 0;
  CVXCatFile file;
  if (ParseOid(nameOrOid, &oid) && engine_.GetFile(oid, file) == VX_OK) return oid;
  fs::path path(CanonicalPath(nameOrOid));
  uint32_t folder = FindFolder(path.parent_path().string());
  return folder == 0 ? 0 : catalog().LookupFile(path.filename().string(), folder);
}

uint32_t Database::FindFolder(const std::string& path) {
  const CVXURI wanted(CanonicalPath(path), true);
  std::vector<uint32_t> folders;
  engine_.GetFolders(folders);
  CVXFolder folder;
  for (uint32_t oid : folders) {
    if (engine_.GetFolder(oid, folder) == VX_OK && folder.URI() == wanted) return oid;
  }
  return 0;
}

uint32_t Database::FindCategory(const std::string& nameOrOid) {
  uint32_t oid = 0;
  CVXGroup group;
  if (ParseOid(nameOrOid, &oid) && engine_.GetGroup(oid, group) == VX_OK) return oid;
  return catalog().LookupGroup(nameOrOid);
}

std::vector<uint8_t> Database::Thumbnail(uint32_t oid) {
  CVXThumb thumb;
  if (engine_.GetThumb(oid, thumb) != VX_OK || thumb.Data() == nullptr) return {};
  return std::vector<uint8_t>(thumb.Data(), thumb.Data() + thumb.DataSize());
}

std::vector<uint32_t> Database::AllFiles() {
  CBitVector bits;
  std::vector<uint32_t> oids;
  if (engine_.GetFiles(bits) != VX_OK) return oids;
  bits.Convert(oids);
  return oids;
}

std::string Database::CanonicalPath(const std::string& path) {
  std::error_code ec;
  fs::path canonical = fs::canonical(path, ec);
  if (!ec) return canonical.string();
  return fs::absolute(path, ec).lexically_normal().string();
}

bool Database::ParseOid(const std::string& text, uint32_t* oid) {
  if (text.empty() || text.size() > 10) return false;
  uint64_t value = 0;
  for (char c : text) {
    if (c < '0' || c > '9') return false;
    value = value * 10 + static_cast<uint64_t>(c - '0');
  }
  if (value == 0 || value > UINT32_MAX) return false;
  *oid = static_cast<uint32_t>(value);
  return true;
}

}  // namespace vx
