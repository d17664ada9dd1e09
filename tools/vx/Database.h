#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <vxcore3/vxcore3.h>

namespace vx {

// Exit codes of the vx command, for scripts.
enum ExitCode : int {
  kExitOk = 0,
  kExitFailure = 1,   // the database cannot be opened or an operation of it failed
  kExitUsage = 2,     // bad arguments
  kExitNotFound = 3,  // a file, folder or category named on the command line is unknown
};

// A column of the image property table as the importer fills it.
struct PropertyColumn {
  const char* name;
  unsigned type;  // EVXPropertyType
};
// The columns in the order they are defined in a new database.
const std::vector<PropertyColumn>& ImagePropertyColumns();

// One open database: the engine and what every command needs of it. Paths on the command line
// are native; the catalog keeps them as URIs, so lookups go through canonical paths.
class Database {
 public:
  Database() = default;
  ~Database();
  Database(const Database&) = delete;
  Database& operator=(const Database&) = delete;

  // Both print the reason to stderr on failure. Create refuses to overwrite an existing
  // database unless `overwrite`.
  bool Create(const std::string& path, uint32_t thumbSide, uint32_t thumbQuality, bool overwrite);
  bool Open(const std::string& path, bool readOnly);
  void Close();

  CVXEngine& engine() { return engine_; }
  CVXCatalog& catalog() { return engine_.Catalog(); }

  // Defines the columns of the image property table that the importer fills and that are
  // missing; returns the table as defined afterwards.
  bool EnsurePropertyTable(CVXTable* table);

  // The native path of a file of the catalog; empty when it has none.
  std::string FilePath(uint32_t oid);
  // A file named by its OID (decimal) or by its path; 0 when the catalog has no such file.
  uint32_t FindFile(const std::string& nameOrOid);
  // The folder at a path, by URI; 0 when the catalog has none.
  uint32_t FindFolder(const std::string& path);
  // A category by full name ("Trips.Alps") or OID; 0 when there is none.
  uint32_t FindCategory(const std::string& nameOrOid);
  // How big the importer decodes this database's images: at the thumbnail's side, so that the
  // thumbnail is the decoded image itself, but at least 256 and at most 1024 pixels. The shape
  // record needs far less, and JPEG shrinks on load by powers of two, so decoding no larger
  // than needed is the largest saving an import can make. Outside images for a search decode
  // the same way, so that their shape records compare on equal terms.
  uint32_t DecodeSide();
  // The stored thumbnail's bytes; empty when the file has none.
  std::vector<uint8_t> Thumbnail(uint32_t oid);
  // Every file of the catalog, rising OIDs.
  std::vector<uint32_t> AllFiles();

  // The path made absolute and canonical when it exists, else only absolute.
  static std::string CanonicalPath(const std::string& path);
  // A decimal OID; false for anything else.
  static bool ParseOid(const std::string& text, uint32_t* oid);

 private:
  CVXEngine engine_;
};

}  // namespace vx
