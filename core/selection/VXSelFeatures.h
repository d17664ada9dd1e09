#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "VXSelCoreData.h"
#include "bitvector.h"

// The feature records that test what the catalog knows of a file: format, place, name, size,
// date and dimensions, and the limits of the result. Each has its key in a CVXSelector (kKey).
// Field lists below are in stream order after the record block's version and tag; where a field
// arrived in a later version, older streams read it as stated.

// Formats: bit set in CVXFile's form; ListMode, GrayScaleMode: u32.
struct SSelFileFormat : SSelCoreData {
  static constexpr char kKey[] = "VXSELFileFormat";

  CBitVector Formats;          // one bit per format code
  uint32_t ListMode = 0;       // 0: format equal to the original's; 1: Formats is the list
  uint32_t GrayScaleMode = 0;  // 0: grey-scale flags must agree; 1: may differ at a cost

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};

// u32 count, count u32 OIDs, u32 Op, u8 Recursive, u32 Mode (from 2; older streams: 1).
struct SSelFolders : SSelCoreData {
  static constexpr char kKey[] = "VXSELFolders";

  uint32_t Mode = 0;  // 1: the listed folders; otherwise the active folder
  std::vector<uint32_t> Folders;
  uint32_t Op = 0;  // non-zero: ESelectOp 1, zero: ESelectOp 0
  uint8_t Recursive = 0;

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};

// u32 Mode, u32 count, count u32 OIDs, u32 Op.
struct SSelCategories : SSelCoreData {
  static constexpr char kKey[] = "VXSELCategories";

  uint32_t Mode = 0;  // 0: the originals' categories; 1: the listed ones; 2: the active one
  std::vector<uint32_t> Categories;
  uint32_t Op = 0;  // as in SSelFolders

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};

// u32 Mode, string Pattern, u32 Invert (from 2; older: 0). Load and Store keep the invariant
// NeedsOriginals == (Mode is 0 or 1): smart and loose matching compare with the originals' names.
struct SSelFileName : SSelCoreData {
  static constexpr char kKey[] = "VXSELFileName";

  uint32_t Mode = 0;  // 0 smart, 1 loose, 2 regular expression, 3 word pattern
  std::string Pattern;
  uint32_t Invert = 0;

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};

// u32 MaxKB, MinKB, TolerancePercent, Mode.
struct SSelFileSize : SSelCoreData {
  static constexpr char kKey[] = "VXSELFileSize";

  uint32_t Mode = 0;  // 0: relative to the original; 1: absolute range
  uint32_t MaxKB = 0;
  uint32_t MinKB = 0;
  uint32_t TolerancePercent = 0;

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};

// u32 Relation, Mode, Amount, Unit, Direction, From, To.
struct SSelFileDateTime : SSelCoreData {
  static constexpr char kKey[] = "VXSELFileDateTime";

  uint32_t Mode = 0;      // 0: relative to the original; 1: absolute range
  uint32_t Relation = 0;  // 0 within a distance, 1 not later, 2 not earlier than the original
  uint32_t Amount = 0;
  uint32_t Unit = 0;       // 0 days, 1 weeks, 2 months of 30 days, 3 years of 365 days
  uint32_t Direction = 0;  // 0 either side, 1 only earlier, 2 only later
  uint32_t From = 0;       // time stamps
  uint32_t To = 0;

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};

// u32 ExactDuplicates, Mode, MinScore, Reserved, MaxResults, DropEmpty, PropsAny (from 2;
// older: 0). Load caps MaxResults at kMaxResultsCap, and reads a version 2 stream's MaxResults
// of 1 as 500.
struct SSelLimits : SSelCoreData {
  static constexpr char kKey[] = "VXSELLimits";
  static constexpr uint32_t kMaxResultsCap = 32000;

  uint32_t Mode = 0;  // 1: MinScore enforced per feature and on the result lists
  uint32_t ExactDuplicates = 0;
  uint32_t MinScore = 0;  // percent
  uint32_t Reserved = 0;
  uint32_t MaxResults = 0;  // per result set
  uint32_t DropEmpty = 0;   // drop originals without hits
  uint32_t PropsAny = 0;    // 0: all property features must match; 1: one is enough

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};

// u32 TolerancePercent, MaxHeight, MinHeight, MaxWidth, MinWidth, Mode, Orientation, SubMode.
struct SSelDimensions : SSelCoreData {
  static constexpr char kKey[] = "VXSELDimensions";

  uint32_t Mode = 0;              // 0: relative to the original; 1: absolute
  uint32_t SubMode = 0;           // 0 width and height, 1 width only, 2 height only
  uint32_t TolerancePercent = 0;  // 1000 or more: no relative comparison
  uint32_t MaxHeight = 0;
  uint32_t MinHeight = 0;
  uint32_t MaxWidth = 0;
  uint32_t MinWidth = 0;
  uint32_t Orientation = 0;  // 0 any, 1 as the original, 2 landscape, 3 portrait

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};
