#pragma once

#include <cstdint>
#include <string>

// Records of the engine that are stored byte for byte. All are packed little-endian structures;
// the static_asserts pin their stored sizes.
#pragma pack(push, 1)

// Thumbnail settings, record 5/1 of the feature match store. The host decides what they drive;
// the engine only keeps them.
struct SVXThumbInfoNew {
  uint32_t Field0 = 0;
  uint32_t Width = 0;
  uint32_t Height = 0;
  uint32_t Depth = 0;
  uint32_t Quality = 0;
  uint32_t Version = 0;
  uint8_t Reserved[256] = {};
};
static_assert(sizeof(SVXThumbInfoNew) == 280);

// Core info, records 1/1 (main) and 4/1 (copy) of the feature match store. Magic and version are
// written but not tested on load; the old thumbnail fields only seed record 5/1 of a database
// that lacks it.
struct SVXCoreInfo {
  char Magic[4] = {};
  uint16_t Version = 0;
  uint32_t Reserved0 = 0;
  int32_t LastUpdate = 0;
  uint32_t OldThumbField0 = 0;
  uint32_t OldThumbWidth = 0;
  uint32_t OldThumbHeight = 0;
  uint32_t OldThumbDepth = 0;
  uint8_t OldThumbQuality = 0;
  uint8_t Fill[3] = {};
  uint8_t Reserved[1024] = {};
  uint8_t AppData[4096] = {};
};
static_assert(sizeof(SVXCoreInfo) == 5154);

#pragma pack(pop)

constexpr uint16_t VX_CORE_INFO_VERSION = 768;  // bytes 0 and 3
constexpr unsigned VX_APP_DATA_SIZE = 4096;
// The property table that holds one row of image properties per file, keyed by the file's OID.
constexpr uint32_t VX_IMAGE_PROPERTIES_TABLE = 1000;

// What the host passes to CVXEngine::Create and Open; the engine keeps a copy.
struct SVXCreateInfo {
  std::string Name;            // path of the feature match store; the others derive from it
  bool ReadOnly = false;       // open every store read-only
  bool EnableCaching = false;  // passed to the match store's EnableCaching
  bool CreateFlag = false;     // Create passes 1 to the match store's Create when set
  uint32_t CacheSize = 0;      // passed to the match store's EnableCaching
  SVXThumbInfoNew ThumbInfo;   // thumbnail settings of a new database
  std::string PlugInFolder;    // where plug-in modules lie; empty on Create loads none
};

// Messages of the host callback.
enum ECBMessage : unsigned {
  cbmOptimizeBegin = 0,
  cbmSelfTestBegin = 1,
  cbmOptimizeCatalog = 2,
  cbmOptimizeMatch = 3,
  cbmOptimizeProperties = 5,
  cbmOptimizeThumbs = 6,
  cbmOptimizeSort = 7,
  cbmTestCatalog = 8,
  cbmTestMatch = 9,
  cbmTestProperties = 11,
  cbmTestThumbs = 12,
  cbmTestSort = 13,
  cbmCrossCheck = 14,
  cbmProgress = 15,
  cbmStageEnded = 16,
  cbmOperationEnded = 17,
  cbmLoadFiles = 5000,
  cbmLoadFolders = 5001,
  cbmLoadGroups = 5002,
  cbmLoadProgress = 5003,
  cbmLoadStageEnded = 5004,
};

// The host callback: (message, user value, a, b, text).
using VXCallback = void (*)(ECBMessage message, void* user, unsigned long a, unsigned long b,
                            const char* text);
