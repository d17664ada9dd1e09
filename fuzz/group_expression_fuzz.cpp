// Arbitrary text as the formula of one category of a small catalog, then printed and calculated.
// Formulas accumulate across inputs, so later inputs calculate through earlier ones, loops that
// were stored anyway included. Never a crash or a hang; a calculation that succeeds stays within
// the catalog's files.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <vector>

#include "VXCatFile.h"
#include "VXEngine.h"
#include "VXFolder.h"
#include "VXGroup.h"
#include "VXResult.h"
#include "VXURI.h"
#include "vxcatalog.h"

namespace {

// Top {Left, Right {Deep}}, Other; folders c:/pics (VOL.1234) with c:/pics/sub, d:/other.
struct Fixture {
  std::filesystem::path dir;
  CVXEngine engine;
  std::vector<uint32_t> groups;

  Fixture() {
    std::string pattern = (std::filesystem::temp_directory_path() / "vxfuzz-XXXXXX").string();
    dir = mkdtemp(pattern.data());
    Cat().Create((dir / "db.vxc").string());
    uint32_t pics = Folder("c:/pics", "VOL", "1234");
    uint32_t sub = Folder("c:/pics/sub", "VOL", "1234");
    uint32_t other = Folder("d:/other", "", "");
    std::vector<uint32_t> files;
    for (uint32_t folder : {pics, pics, sub, other}) {
      uint32_t oid = Cat().GenerateFileOID();
      Cat().AddFile(folder, CVXCatFile(oid, "f" + std::to_string(oid) + ".jpg", folder));
      files.push_back(oid);
    }
    uint32_t top = Group("Top", 0, files[0]);
    Group("Left", top, files[1]);
    uint32_t right = Group("Right", top, files[2]);
    Group("Deep", right, files[3]);
    Group("Other", 0, files[0]);
    groups.push_back(VX_ALL_GROUP_OID);
  }
  ~Fixture() {
    Cat().Close();
    std::error_code ec;
    std::filesystem::remove_all(dir, ec);
  }
  CVXCatalog& Cat() { return engine.Catalog(); }
  uint32_t Folder(const std::string& uri, const std::string& media, const std::string& serial) {
    uint32_t oid = Cat().GenerateFolderOID();
    CVXFolder folder(CVXURI(uri, true), oid, 0);
    folder.MediaID() = media;
    folder.MediaSerial() = serial;
    Cat().AddFolder(folder);
    return oid;
  }
  uint32_t Group(const std::string& name, uint32_t parent, uint32_t file) {
    CVXGroup g(Cat().GenerateGroupOID());
    g.Name() = name;
    g.Parent() = parent;
    g.Images().Set(file);
    Cat().AddGroup(g);
    groups.push_back(g.Oid());
    return g.Oid();
  }
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static Fixture fx;
  if (size == 0) return 0;
  const uint32_t oid = fx.groups[data[0] % fx.groups.size()];
  const std::string text(reinterpret_cast<const char*>(data + 1), size - 1);
  CVXGroup g;
  if (fx.Cat().LookupGroup(oid, g) != VX_OK) std::abort();
  SError e = g.SetExpression(fx.Cat(), text);
  // Store whatever the lists hold now, half-converted ones too: later inputs calculate them.
  if (!g.InError()) fx.Cat().UpdateGroup(g);
  g.Expression(fx.Cat());
  const bool refused = g.InError();
  if (refused && e.code == VX_OK) std::abort();
  CBitVector bits;
  unsigned rc = g.Calculate(fx.Cat(), bits);
  if (refused && rc != VX_FORMULA_CIRCULAR) std::abort();
  if (rc == VX_OK) {
    CBitVector all;
    fx.Cat().GetFiles(all);
    bits.AndNot(all);
    if (!bits.IsEmpty()) std::abort();
  }
  return 0;
}
