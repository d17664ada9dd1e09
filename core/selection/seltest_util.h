#pragma once

// Shorthands shared by the selection tests: feature records and streamed objects to and from
// bytes, and the core block that every stored feature starts with.

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

template <typename T>
T Fresh() {
  T record;
  record.Reset();
  return record;
}

// The record as a selector holds it (with its core block); taken by value, since Store may
// touch the record.
template <typename T>
CVXMemFile Blob(T record, bool withCore = true) {
  CVXMemFile file;
  record.Store(&file, withCore);
  return file;
}

template <typename T>
std::vector<uint8_t> Stored(const T& record, bool withCore = true) {
  return Content(Blob(record, withCore));
}

// A reset record loaded from `bytes`, which it must read to the end.
template <typename T>
T Loaded(const std::vector<uint8_t>& bytes, bool withCore = true) {
  CVXMemFile in(bytes.data(), bytes.size());
  T record = Fresh<T>();
  record.Load(&in, withCore);
  EXPECT_EQ(in.Remaining(), 0u);
  return record;
}

// The bytes of an object written with operator<<.
template <typename T>
std::vector<uint8_t> Streamed(const T& object) {
  CVXMemFile file;
  file << object;
  return Content(file);
}

// `target` after reading `bytes` with operator>>, which must read them to the end.
template <typename T>
T Read(const std::vector<uint8_t>& bytes, T target) {
  CVXMemFile in(bytes.data(), bytes.size());
  in >> target;
  EXPECT_EQ(in.Remaining(), 0u);
  return target;
}

// Every proper prefix of `full` fails to read with VX_NOT_FOUND and leaves a copy of `keep`
// streaming as it did.
template <typename T>
void ExpectPrefixesFail(const std::vector<uint8_t>& full, const T& keep) {
  const std::vector<uint8_t> kept = Streamed(keep);
  for (size_t cut = 0; cut < full.size(); ++cut) {
    T target = keep;
    CVXMemFile in(full.data(), cut);
    EXPECT_EQ(ThrownCode([&] { in >> target; }), VX_NOT_FOUND) << cut;
    ASSERT_EQ(Streamed(target), kept) << cut;
  }
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
