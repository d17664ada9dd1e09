#pragma once

// Shorthands shared by the selection tests: feature records to and from bytes, and the core
// block that every stored feature starts with.

#include <gtest/gtest.h>

#include <cstdint>
#include <vector>

#include "VXMemFile.h"
#include "VXResult.h"
#include "VXSelCoreData.h"
#include "vxbytes.h"
#include "vxlib_test_util.h"

namespace seltest {

using vxtest::Bytes;

inline std::vector<uint8_t> Content(const CVXMemFile& file) {
  return {file.GetBuffer(), file.GetBuffer() + file.GetFileSize()};
}

// The bytes a record stores; taken by value, since Store may touch the record.
template <typename T>
std::vector<uint8_t> Stored(T record, bool withCore = true) {
  CVXMemFile file;
  record.Store(&file, withCore);
  return Content(file);
}

// A reset record loaded from `bytes`, which it must read to the end.
template <typename T>
T Loaded(const std::vector<uint8_t>& bytes, bool withCore = true) {
  CVXMemFile in(bytes.data(), bytes.size());
  T record;
  record.Reset();
  record.Load(&in, withCore);
  EXPECT_EQ(in.Remaining(), 0u);
  return record;
}

// The record as a selector holds it: stored with its core block.
template <typename T>
CVXMemFile Blob(T record) {
  CVXMemFile file;
  record.Store(&file, true);
  return file;
}

// Distinct core values: Active, InterActive, Option 7, UserData 0, 1, ..., 127.
inline void SetSampleCore(SSelCoreData& core) {
  core.Active = core.InterActive = true;
  core.Option = 7;
  for (int i = 0; i < 128; ++i) core.UserData[i] = static_cast<uint8_t>(i);
}

// The core block of a version 3 stream holding those values.
inline Bytes SampleCore(bool needsOriginals = false) {
  Bytes b;
  b.u16(3).str("SCD").le(uint8_t{1}).le(uint8_t{needsOriginals}).le(uint8_t{1}).u32(7);
  for (int i = 0; i < 128; ++i) b.le(static_cast<uint8_t>(i));
  return b;
}

// A core block of the given flags, Option 0 and UserData zero.
inline Bytes PlainCore(bool active, bool needsOriginals, bool interActive) {
  Bytes b;
  b.u16(3).str("SCD").le(uint8_t{active}).le(uint8_t{needsOriginals}).le(uint8_t{interActive});
  b.u32(0).b.resize(b.b.size() + 128);
  return b;
}

}  // namespace seltest
