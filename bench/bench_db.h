#pragma once

// Large databases for the benchmarks, written straight into their stores in one transaction
// each: going through the engine's operations would take longer than the runs they measure.

#include <sqlite3.h>
#include <stdlib.h>

#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "QRLBlobDB.h"
#include "VXCatFile.h"
#include "VXEngine.h"
#include "VXFolder.h"
#include "VXMemFile.h"
#include "VXURI.h"
#include "vxcatalog.h"

namespace vxbench {

// The benchmarks' scratch directory. VXBENCH_DIR names one that is kept, so that a profiling
// session builds its databases once; otherwise a fresh one under /tmp is removed at exit.
inline std::string Scratch(const std::string& name) {
  static const std::string dir = [] {
    if (const char* kept = getenv("VXBENCH_DIR"); kept && *kept) {
      std::filesystem::create_directories(kept);
      return std::string(kept);
    }
    char tmpl[] = "/tmp/vxbench_XXXXXX";
    if (!mkdtemp(tmpl)) std::abort();
    static const std::string made(tmpl);
    std::atexit([] { std::filesystem::remove_all(made); });
    return made;
  }();
  return dir + "/" + name;
}

template <typename T>
void Put(CQRLBlobDB& db, uint16_t type, uint32_t oid, const T& object) {
  CVXMemFile file;
  file << object;
  db.Set(CQRLBlobDB::SSelector(type, oid), file.GetBuffer(),
         static_cast<unsigned>(file.GetFileSize()));
}

// Runs `write` on the store at `path` inside one transaction.
inline void InTransaction(const std::string& path, const std::function<void(CQRLBlobDB&)>& write) {
  CQRLBlobDB db;
  db.Open(path, false);
  sqlite3_exec(db.Handle(), "BEGIN", nullptr, nullptr, nullptr);
  write(db);
  sqlite3_exec(db.Handle(), "COMMIT", nullptr, nullptr, nullptr);
  db.Close();
}

// A catalog of `files` files (OIDs 1..files) spread round-robin over `folders` folders; `file`
// may fill in each record before it is stored.
inline void WriteCatalog(const std::string& path, uint32_t files, uint32_t folders,
                         const std::function<void(CVXCatFile&)>& file = nullptr) {
  InTransaction(path, [&](CQRLBlobDB& db) {
    std::vector<CVXFolder> list;
    for (uint32_t f = 1; f <= folders; ++f) {
      list.emplace_back(CVXURI("/photos/f" + std::to_string(f) + "/", true), f, 0);
    }
    for (uint32_t oid = 1; oid <= files; ++oid) {
      uint32_t folder = (oid - 1) % folders + 1;
      CVXCatFile record(oid, "IMG_" + std::to_string(oid) + ".JPG", folder);
      record.Properties().Width = 4000;
      record.Properties().Height = 3000;
      if (file) file(record);
      Put(db, CVXCatalog::rtFile, oid, record);
      list[folder - 1].Files().push_back(oid);
    }
    for (const CVXFolder& f : list) Put(db, CVXCatalog::rtFolder, f.Oid(), f);
  });
}

}  // namespace vxbench
