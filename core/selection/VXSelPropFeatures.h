#pragma once

#include <cstdint>
#include <string>

#include "VXProperty.h"
#include "VXSelCoreData.h"

// The feature records that test metadata: a column of the image property table, and the XMP
// full-text index. Field lists are in stream order after the record block's version and tag.

// u32 DataType, string Table, string Column, u32 MatchEmpty, u32 condition count (3 written),
// per condition u32 Op, u32 MatchMode, u32 Flags, then Low, High, Value as properties; u32
// Invert (from 2; older: 0). A record holds exactly three conditions: a stream with fewer leaves
// the rest as Reset makes them, one with more is read through and the extra ones dropped.
//
// Several property features may live in one selector, each under its own key (GenerateID).
struct SSelProps : SSelCoreData {
  static constexpr char kKeyPrefix[] = "VXSELProperties";
  static constexpr uint32_t kConditions = 3;

  struct SCondition {
    uint32_t Op = 0;
    uint32_t Flags = 0;
    uint32_t MatchMode = 0;
    CVXProperty Low;
    CVXProperty High;
    CVXProperty Value;
  };

  uint32_t DataType = 0;  // property type code
  std::string Table;
  std::string Column;
  bool MatchEmpty = false;
  uint32_t Invert = 0;
  SCondition Conditions[kConditions];

  // "VXSELProperties.<table>.<column>".
  static std::string GenerateID(const std::string& table, const std::string& column);

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};

// u32 UseField, u32 Reserved, string Field, string Query, u32 Flag (from 2; older: false),
// u32 Exclude (from 3; older: 0).
struct SSelXMP : SSelCoreData {
  static constexpr char kKey[] = "VXSELXMP";

  uint32_t UseField = 0;  // non-zero: the query is limited to Field
  uint32_t Reserved = 0;
  std::string Field;
  std::string Query;
  bool Flag = false;     // passed on to the full-text query
  uint32_t Exclude = 0;  // 1: remove the files found instead of keeping them

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};
