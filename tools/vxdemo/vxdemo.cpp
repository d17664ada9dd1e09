// A small host of the engine: creates a database at the given path, lists its store files with
// their sizes, reopens it and prints what the engine reports about it.
#include <vxcore3/vxcore3.h>

#include <cstdio>
#include <ctime>
#include <filesystem>
#include <string>

namespace {

const char* const kStoreExts[] = {"", ".vxc", ".vxp", ".vxt", ".vxlt", ".vxl", ".v3x"};

void PrintStores(CVXEngine& engine) {
  std::printf("%-40s %12s\n", "store file", "bytes");
  for (const char* ext : kStoreExts) {
    std::string path = engine.StorePath(ext);
    std::error_code ec;
    auto size = std::filesystem::file_size(path, ec);
    std::printf("%-40s %12s\n", std::filesystem::path(path).filename().c_str(),
                ec ? "missing" : std::to_string(size).c_str());
  }
}

void PrintStatistics(CVXEngine& engine) {
  std::string name;
  engine.GetPathAndName(name);
  std::time_t updated = engine.LastUpdate();
  char when[64];
  std::strftime(when, sizeof when, "%Y-%m-%d %H:%M:%S", std::localtime(&updated));
  SVXThumbInfoNew thumbs = engine.GetThumbInfo();
  const SVXCatalogHeader& header = engine.Catalog().Header();
  std::printf("database            %s\n", name.c_str());
  std::printf("open / read-only    %s / %s\n", engine.IsOpen() ? "yes" : "no",
              engine.IsReadOnly() ? "yes" : "no");
  std::printf("last update         %s\n", when);
  std::printf("thumbnails          %ux%u, depth %u, quality %u\n", thumbs.Width, thumbs.Height,
              thumbs.Depth, thumbs.Quality);
  std::printf("last OIDs           folder %u, file %u, category %u, selection %u\n",
              header.LastFolderOid, header.LastFileOid, header.LastGroupOid, header.LastPersSelOid);
  std::printf("categories          %zu:", engine.Catalog().Groups().size());
  for (const auto& [oid, group] : engine.Catalog().Groups()) {
    std::printf(" \"%s\" (%08X)", group.Name().c_str(), oid);
  }
  std::printf("\n");
}

int Fail(const char* what, unsigned code) {
  std::fprintf(stderr, "vxdemo: %s failed with %u\n", what, code);
  return 1;
}

}  // namespace

int main(int argc, char** argv) {
  std::string path = argc > 1 ? argv[1] : "demo.vxm";
  CQRLLogfile log(path + ".log");
  log.SetLevel(3);

  SVXCreateInfo info;
  info.Name = path;
  info.ThumbInfo.Width = info.ThumbInfo.Height = 256;
  info.ThumbInfo.Depth = 24;
  info.ThumbInfo.Quality = 85;
  info.ThumbInfo.Version = 1;
  {
    CVXEngine engine;
    engine.SetLogFile(&log);
    if (unsigned rc = engine.Create(info); rc != VX_OK) return Fail("Create", rc);
    const char note[] = "created by vxdemo";
    engine.SetAppData(note, sizeof note);
    if (unsigned rc = engine.Close(); rc != VX_OK) return Fail("Close", rc);
    std::printf("Created %s\n\n", path.c_str());
    PrintStores(engine);
  }
  CVXEngine engine;
  engine.SetLogFile(&log);
  unsigned loadMessages = 0;
  auto onLoad = [](ECBMessage, void* user, unsigned long, unsigned long, const char*) {
    ++*static_cast<unsigned*>(user);
  };
  if (unsigned rc = engine.Open(info, onLoad, &loadMessages); rc != VX_OK) {
    return Fail("Open", rc);
  }
  std::printf("\nReopened (%u load messages)\n\n", loadMessages);
  PrintStatistics(engine);
  uint8_t appData[VX_APP_DATA_SIZE];
  engine.GetAppData(appData);
  std::printf("application data    \"%s\"\n", reinterpret_cast<const char*>(appData));
  engine.Close();
  std::printf("\nLog: %s.log\n", path.c_str());
  return 0;
}
