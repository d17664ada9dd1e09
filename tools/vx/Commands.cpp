#include "Commands.h"

#include <cstdio>
#include <ctime>
#include <filesystem>
#include <iostream>

#include "ImageFormat.h"

namespace vx {

namespace {

std::string TimeText(int64_t seconds) {
  if (seconds == 0) return std::string();
  const std::time_t t = static_cast<std::time_t>(seconds);
  std::tm tm{};
  localtime_r(&t, &tm);
  char text[32];
  std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &tm);
  return text;
}

void PrintCounts(const ImportCounts& c, bool json) {
  if (json) {
    vxhost::JsonWriter w(std::cout);
    w.BeginObject().Key("imported").UInt(c.imported).Key("updated").UInt(c.updated);
    w.Key("unchanged").UInt(c.unchanged).Key("skipped").UInt(c.skipped);
    const ImportTimes& t = c.times;
    w.Key("seconds").BeginObject().Key("wall").Double(t.wall).Key("crc").Double(t.crc);
    w.Key("decode").Double(t.decode).Key("metadata").Double(t.metadata);
    w.Key("thumbnail").Double(t.thumbnail).Key("library").Double(t.library).EndObject();
    w.EndObject();
    std::cout << "\n";
    return;
  }
  std::printf(
      "imported %llu, updated %llu, unchanged %llu, skipped %llu\n",
      static_cast<unsigned long long>(c.imported), static_cast<unsigned long long>(c.updated),
      static_cast<unsigned long long>(c.unchanged), static_cast<unsigned long long>(c.skipped));
}

// Name and value of every column that holds one.
std::vector<std::pair<std::string, std::string>> PropertyTexts(Database& db, uint32_t oid) {
  std::vector<std::pair<std::string, std::string>> out;
  CVXTable table(VX_IMAGE_PROPERTIES_TABLE);
  std::vector<CVXProperty> row;
  if (db.engine().GetImagePropertiesTable(table) != VX_OK ||
      db.engine().GetImageProperties(oid, row) != VX_OK) {
    return out;
  }
  for (size_t i = 0; i < row.size() && i < table.Columns().size(); ++i) {
    if (!row[i].IsEmpty()) out.emplace_back(table.Columns()[i].Name, row[i].String());
  }
  return out;
}

}  // namespace

void WriteFileJson(vxhost::JsonWriter& json, Database& db, uint32_t oid) {
  CVXCatFile file;
  db.engine().GetFile(oid, file);
  const CVXCatFile::SData& d = file.Properties();
  json.BeginObject().Key("oid").UInt(oid).Key("path").String(db.FilePath(oid));
  json.Key("width").UInt(d.Width).Key("height").UInt(d.Height).Key("size").UInt(d.Size);
  json.Key("format").String(vxhost::FormatName(d.Format)).EndObject();
}

void PrintFiles(Database& db, const std::vector<uint32_t>& oids, bool json) {
  if (!json) {
    for (uint32_t oid : oids) std::printf("%s\n", db.FilePath(oid).c_str());
    return;
  }
  vxhost::JsonWriter w(std::cout);
  w.BeginArray();
  for (uint32_t oid : oids) WriteFileJson(w, db, oid);
  w.EndArray();
  std::cout << "\n";
}

int CreateCommand(const std::string& path, uint32_t thumbSide, uint32_t thumbQuality, bool force) {
  Database db;
  if (!db.Create(path, thumbSide, thumbQuality, force)) return kExitFailure;
  std::printf("created %s\n", path.c_str());
  return kExitOk;
}

int ImportCommand(const std::string& path, const std::vector<std::string>& dirs,
                  const ImportOptions& options, bool json) {
  for (const std::string& dir : dirs) {
    std::error_code ec;
    if (!std::filesystem::is_directory(dir, ec)) {
      std::fprintf(stderr, "vx: %s is not a directory\n", dir.c_str());
      return kExitUsage;
    }
  }
  Database db;
  CVXTable table;
  if (!db.Open(path, false) || !db.EnsurePropertyTable(&table)) return kExitFailure;
  Importer importer(&db, table, options);
  const ImportCounts counts = importer.Run(dirs);
  for (const std::string& problem : importer.Problems()) {
    std::fprintf(stderr, "skipped %s\n", problem.c_str());
  }
  PrintCounts(counts, json);
  return kExitOk;
}

int LsCommand(const std::string& path, const std::string& folder, const std::string& category,
              bool json) {
  Database db;
  if (!db.Open(path, true)) return kExitFailure;
  std::vector<uint32_t> oids;
  if (!category.empty()) {
    const uint32_t group = db.FindCategory(category);
    if (group == 0) {
      std::fprintf(stderr, "vx: no category %s\n", category.c_str());
      return kExitNotFound;
    }
    db.engine().GetGroupImages(group, oids);
  } else if (!folder.empty()) {
    const uint32_t oid = db.FindFolder(folder);
    if (oid == 0) {
      std::fprintf(stderr, "vx: no folder %s in the database\n", folder.c_str());
      return kExitNotFound;
    }
    db.engine().GetFolderFiles(oid, oids, true);
  } else {
    oids = db.AllFiles();
  }
  PrintFiles(db, oids, json);
  return kExitOk;
}

int InfoCommand(const std::string& path, const std::string& name, bool json) {
  Database db;
  if (!db.Open(path, true)) return kExitFailure;
  const uint32_t oid = db.FindFile(name);
  CVXCatFile file;
  if (oid == 0 || db.engine().GetFile(oid, file) != VX_OK) {
    std::fprintf(stderr, "vx: no file %s in the database\n", name.c_str());
    return kExitNotFound;
  }
  const CVXCatFile::SData& d = file.Properties();
  const bool embedded = (d.Flags & cfEmbeddedTimeValid) != 0;
  SXMPRecord xmp;
  xmp.Oid = oid;
  const bool hasXmp = db.engine().GetXMP(&xmp, false) == VX_OK;
  std::vector<SFTIRecord> tags;
  db.engine().GetXMPFTI(oid, tags);
  const auto properties = PropertyTexts(db, oid);

  if (json) {
    vxhost::JsonWriter w(std::cout);
    w.BeginObject().Key("file");
    WriteFileJson(w, db, oid);
    w.Key("crc").UInt(d.CRC).Key("fileTime").Int(d.FileTime);
    w.Key("embeddedTime");
    embedded ? w.Int(d.EmbeddedTime) : w.Null();
    w.Key("greyscale").Bool(file.IsGreyscale()).Key("properties").BeginObject();
    for (const auto& [key, value] : properties) w.Key(key).String(value);
    w.EndObject().Key("xmp").BeginObject();
    w.Key("rating").Int(hasXmp ? xmp.Rating : 0).Key("label").String(xmp.Label);
    w.Key("packetBytes").UInt(xmp.Packet.size()).EndObject().Key("tags").BeginArray();
    for (const SFTIRecord& t : tags) {
      w.BeginObject().Key("tag").String(t.Tag).Key("value").String(t.Value).EndObject();
    }
    w.EndArray().EndObject();
    std::cout << "\n";
    return kExitOk;
  }
  std::printf("oid           %u\npath          %s\n", oid, db.FilePath(oid).c_str());
  std::printf("format        %s\nsize          %u bytes\n", vxhost::FormatName(d.Format), d.Size);
  std::printf("dimensions    %u x %u%s\n", d.Width, d.Height, file.IsGreyscale() ? " grey" : "");
  std::printf("crc           %08X\nfile time     %s\n", d.CRC, TimeText(d.FileTime).c_str());
  if (embedded) std::printf("taken         %s\n", TimeText(d.EmbeddedTime).c_str());
  for (const auto& [key, value] : properties) std::printf("%-13s %s\n", key.c_str(), value.c_str());
  if (hasXmp && (xmp.Rating != 0 || !xmp.Label.empty() || !xmp.Packet.empty())) {
    std::printf("xmp           rating %d, label \"%s\", %zu bytes\n", xmp.Rating, xmp.Label.c_str(),
                xmp.Packet.size());
  }
  for (const SFTIRecord& t : tags) {
    std::printf("tag           %s = %s\n", t.Tag.c_str(), t.Value.c_str());
  }
  return kExitOk;
}

int StatsCommand(const std::string& path, bool json) {
  Database db;
  if (!db.Open(path, true)) return kExitFailure;
  CVXEngine::SVXStats s;
  if (unsigned rc = db.engine().GetStats(s); rc != VX_OK) {
    std::fprintf(stderr, "vx: statistics failed (error %u)\n", rc);
    return kExitFailure;
  }
  const std::pair<const char*, uint64_t> rows[] = {
      {"files", s.Files},
      {"folders", s.Folders},
      {"categories", s.Groups},
      {"properties", s.Properties},
      {"fileBytes", s.FileBytes},
      {"matchStoreBytes", static_cast<uint64_t>(s.MatchDBSize)},
      {"catalogBytes", static_cast<uint64_t>(s.CatalogDBSize)},
      {"thumbnailBytes", static_cast<uint64_t>(s.ThumbDBSize)},
      {"propertyBytes", static_cast<uint64_t>(s.PropDBSize)},
      {"xmpBytes", static_cast<uint64_t>(s.XMPDBSize)},
  };
  if (json) {
    vxhost::JsonWriter w(std::cout);
    w.BeginObject();
    for (const auto& [key, value] : rows) w.Key(key).UInt(value);
    w.Key("lastUpdate").Int(s.LastUpdate).EndObject();
    std::cout << "\n";
    return kExitOk;
  }
  for (const auto& [key, value] : rows) {
    std::printf("%-16s %llu\n", key, static_cast<unsigned long long>(value));
  }
  std::printf("%-16s %s\n", "lastUpdate", TimeText(s.LastUpdate).c_str());
  return kExitOk;
}

}  // namespace vx
