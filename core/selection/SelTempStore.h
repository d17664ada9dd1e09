#pragma once

#include <cstdint>
#include <string>

class CVXEngine;
class CQRLLogfile;

// The selection template store, ".vxl": every template of a database in one small file that is
// read whole at Open and rewritten whole at Flush.
//
// File layout (little-endian): "VXST", u32 version 1, u32 template count, u32 last OID given
// out, 256 reserved bytes, u32 checksum of those 272 bytes; then the templates in rising OID
// order, then u32 checksum of all template bytes. The checksums are the only test of the file;
// magic and version are written and not tested.
//
// Flush writes a sibling temporary file and renames it over the store, so a crash mid-write
// leaves the previous file whole.
class SelTempStore {
 public:
  static constexpr size_t kHeaderSize = 272;

#pragma pack(push, 1)
  struct SHeader {
    char Magic[4] = {'V', 'X', 'S', 'T'};
    uint32_t Version = 1;
    uint32_t Count = 0;
    uint32_t LastOid = 0;
    uint8_t Reserved[256] = {};
  };
#pragma pack(pop)
  static_assert(sizeof(SHeader) == kHeaderSize);

  SelTempStore() = default;
  SelTempStore(const SelTempStore&) = delete;
  SelTempStore& operator=(const SelTempStore&) = delete;

  void SetEngine(CVXEngine* engine) { engine_ = engine; }

  // Sets up an empty header and writes it. Leaves the store open; the caller closes it.
  unsigned Create(const std::string& path);
  // Creates a missing file first (with a warning). A checksum mismatch gives 10007, and a file
  // that cannot be read gives 10020: either way the store stays open and empty, and the next
  // Flush overwrites the damaged file.
  unsigned Open(const std::string& path, bool readOnly);
  // Rewrites the whole file; does nothing on a read-only or closed store.
  unsigned Flush();
  unsigned Close();

  bool IsOpen() const { return open_; }
  bool IsReadOnly() const { return readOnly_; }
  const SHeader& Header() const { return header_; }

 private:
  CQRLLogfile* Log_() const;
  unsigned Read_();
  unsigned Write_();

  // Templates are read and written with the selector stream; until that exists a file holding
  // templates is left untouched (keepFile_) rather than overwritten with an empty store.
  bool keepFile_ = false;
  CVXEngine* engine_ = nullptr;  // not owned; used for the log
  SHeader header_;
  std::string path_;
  bool open_ = false;
  bool readOnly_ = false;
};
