#include "SelTempStore.h"

#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>

#include "VXEngine.h"
#include "VXException.h"
#include "VXLog.h"
#include "VXMemFile.h"
#include "VXResult.h"

CQRLLogfile* SelTempStore::Log_() const { return engine_ ? engine_->LogFile() : nullptr; }

unsigned SelTempStore::Create(const std::string& path) {
  Close();
  header_ = SHeader{};
  path_ = path;
  open_ = true;
  readOnly_ = false;
  keepFile_ = false;
  unsigned rc = Write_();
  if (rc != VX_OK) open_ = false;
  return rc;
}

unsigned SelTempStore::Open(const std::string& path, bool readOnly) {
  VX_LOG(Log_(), 2, "+ Open selection templates");
  Close();
  if (!CVXFile::FileExists(path)) {
    VX_WARN(Log_(), "Creating a new selection template storage");
    unsigned rc = Create(path);
    if (rc != VX_OK) return rc;
    Close();
  }
  path_ = path;
  readOnly_ = readOnly;
  open_ = true;
  unsigned rc = VX_OK;
  try {
    rc = Read_();
  } catch (...) {
    rc = VXCodeOfCurrentException(Log_(), __LINE__, __FILE__);
  }
  if (rc != VX_OK) {
    header_.Count = 0;
    VX_LOG(Log_(), 2, "Clearing templates due to error");
    return rc;
  }
  VX_LOG(Log_(), 2, "- Completed");
  return VX_OK;
}

// Reads the header and the template section. Throws CVXException* 10007 on a checksum mismatch
// and 10020 on a short or unreadable file.
unsigned SelTempStore::Read_() {
  std::ifstream in(path_, std::ios::binary);
  if (!in) VX_THROW(VX_NOT_FOUND);
  std::vector<uint8_t> bytes((std::istreambuf_iterator<char>(in)),
                             std::istreambuf_iterator<char>());
  CVXMemFile file(bytes.data(), bytes.size());
  SHeader header;
  uint32_t stored = 0;
  file.BeginCheckSum();
  file.Read(&header, sizeof header);
  uint32_t sum = file.EndCheckSum();
  file >> stored;
  if (sum != stored) VX_THROW(VX_CHECKSUM);
  if (header.Count != 0) {
    keepFile_ = true;
    VX_THROW(VX_NOT_FOUND);
  }
  file.BeginCheckSum();
  sum = file.EndCheckSum();
  file >> stored;
  if (sum != stored) VX_THROW(VX_CHECKSUM);
  header_ = header;
  return VX_OK;
}

unsigned SelTempStore::Flush() {
  VX_LOG(Log_(), 2, "+ Flusing selection templates");
  if (!open_ || readOnly_ || keepFile_) return VX_OK;
  unsigned rc = VX_OK;
  try {
    rc = Write_();
  } catch (...) {
    rc = VXCodeOfCurrentException(Log_(), __LINE__, __FILE__);
  }
  if (rc != VX_OK) {
    VX_ERROR(Log_(), rc, "Flushing selection templates");
  } else {
    VX_LOG(Log_(), 2, "- Completed");
  }
  return rc;
}

// Writes the whole file to a temporary sibling, syncs it and renames it over the store.
unsigned SelTempStore::Write_() {
  CVXMemFile file(false, 4096, 4096);
  header_.Count = 0;
  file.BeginCheckSum();
  file.Write(&header_, sizeof header_);
  file << file.EndCheckSum();
  file.BeginCheckSum();
  file << file.EndCheckSum();

  std::string temp = path_ + ".tmp";
  FILE* out = std::fopen(temp.c_str(), "wb");
  if (!out) return VX_NOT_FOUND;
  size_t size = static_cast<size_t>(file.GetFileSize());
  bool ok = std::fwrite(file.GetBuffer(), 1, size, out) == size && std::fflush(out) == 0 &&
            ::fsync(fileno(out)) == 0;
  ok = std::fclose(out) == 0 && ok;
  if (!ok || std::rename(temp.c_str(), path_.c_str()) != 0) {
    std::remove(temp.c_str());
    return VX_NOT_FOUND;
  }
  return VX_OK;
}

unsigned SelTempStore::Close() {
  unsigned rc = VX_OK;
  if (open_) rc = Flush();
  open_ = false;
  readOnly_ = false;
  keepFile_ = false;
  header_ = SHeader{};
  return rc;
}
