#pragma once

// A catalog on its own store in a scratch directory, logging through an engine that stays
// closed, with shorthands to populate it. Shared by the catalog and category tests.

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "VXCatFile.h"
#include "VXEngine.h"
#include "VXFolder.h"
#include "VXGroup.h"
#include "VXResult.h"
#include "VXURI.h"
#include "vxcatalog.h"
#include "vxtest.h"

namespace vxtest {

class CatalogFixture : public ::testing::Test {
 protected:
  void SetUp() override {
    engine_.SetLogFile(&log_);
    Cat().Create(Path());
  }
  CVXCatalog& Cat() { return engine_.Catalog(); }
  std::string Path() const { return dir_ / "db.vxc"; }
  void Reopen(bool readOnly = false) {
    Cat().Close();
    Cat().Reset();
    Cat().Open(Path(), readOnly);
  }

  uint32_t AddFolder(const std::string& uri, const std::string& media = "VOL",
                     const std::string& serial = "1234") {
    CVXFolder folder(CVXURI(uri, true), Cat().GenerateFolderOID(), 0);
    folder.MediaID() = media;
    folder.MediaSerial() = serial;
    EXPECT_EQ(Cat().AddFolder(folder), VX_OK);
    return folder.Oid();
  }
  uint32_t AddFile(uint32_t folder, const std::string& name, uint32_t width = 40,
                   uint32_t height = 30, uint32_t crc = 0) {
    CVXCatFile file(Cat().GenerateFileOID(), name, folder);
    file.Properties().Width = width;
    file.Properties().Height = height;
    file.Properties().CRC = crc;
    EXPECT_EQ(Cat().AddFile(folder, file), VX_OK);
    return file.Oid();
  }
  uint32_t AddGroup(const std::string& name, uint32_t parent = 0,
                    const std::vector<uint32_t>& images = {}) {
    CVXGroup g(Cat().GenerateGroupOID());
    g.Name() = name;
    g.Parent() = parent;
    for (uint32_t f : images) g.Images().Set(f);
    EXPECT_EQ(Cat().AddGroup(g), VX_OK);
    return g.Oid();
  }
  CVXGroup Group(uint32_t oid) {
    CVXGroup g;
    EXPECT_EQ(Cat().LookupGroup(oid, g), VX_OK);
    return g;
  }
  CVXFolder Folder(uint32_t oid) {
    CVXFolder f;
    EXPECT_EQ(Cat().LookupFolder(oid, f), VX_OK);
    return f;
  }
  void Store(const CVXGroup& g) { ASSERT_EQ(Cat().UpdateGroup(g), VX_OK); }

  TempDir dir_;
  CapturedLog log_;
  CVXEngine engine_;
};

}  // namespace vxtest
