#pragma once

#include <cstdint>
#include <string>
#include <vector>

class CVXFile;

// The part every feature record of a selection shares, and the base of them all. A record is
// stored in a CVXMemFile and handed to CVXSelector::SetFeature as an opaque blob; whoever runs
// the selection loads it back by its key.
//
// Stream form of a record: the core block (only when `withCore`), then the record block. Core
// block: u16 version, string tag "SCD", u8 Active, u8 NeedsOriginals, u8 InterActive (from 2),
// u32 Option (from 3), 128 bytes UserData (from 2). Record block: u16 version, string tag, the
// record's fields. Tags are written for the reader's eyes only and never compared.
//
// Load throws CVXException* (10020) on a short stream and then leaves the record unchanged.
// After Load, Version holds the version of the last block read: the record block's, if any.
//
// The constructors do not call Reset: a fresh record has the core defaults and zeroed fields,
// so every user calls Reset (or Load) first.
struct SSelCoreData {
  static constexpr uint16_t kVersion = 3;

  uint16_t Version = kVersion;
  bool Active = false;
  bool NeedsOriginals = false;
  bool InterActive = false;  // the user fills the feature in when the selection starts
  uint32_t Option = 0;       // read only on SSelLimits
  uint8_t UserData[128] = {};

  SSelCoreData() = default;
  SSelCoreData(const SSelCoreData&) = default;
  SSelCoreData& operator=(const SSelCoreData&) = default;
  virtual ~SSelCoreData() = default;

  // The core block's defaults; derived records add their own.
  virtual void Reset();
  // On SSelCoreData itself these read or write the core block only (nothing when !withCore).
  virtual void Load(CVXFile* file, bool withCore);
  virtual void Store(CVXFile* file, bool withCore);

  void SetActive(bool active) { Active = active; }
  void SetInterActive(bool interActive) { InterActive = interActive; }

 protected:
  // Core block (if withCore), then the record block's version into Version and its tag,
  // discarded. Returns the file, which must not be null.
  CVXFile& LoadHead_(CVXFile* file, bool withCore);
  // Core block (if withCore), then the record block's version and tag.
  CVXFile& StoreHead_(CVXFile* file, bool withCore, uint16_t version, const char* tag);

  // Stream helpers for the records' fields. Bools stored as u8 or u32 read any non-zero as true.
  static bool ReadBool8_(CVXFile& file);
  static bool ReadBool32_(CVXFile& file);
  static void WriteOids_(CVXFile& file, const std::vector<uint32_t>& oids);
  // The count is checked against what is left before the vector is sized for it.
  static std::vector<uint32_t> ReadOids_(CVXFile& file);
};
