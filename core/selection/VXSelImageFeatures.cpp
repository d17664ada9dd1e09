#include "VXSelImageFeatures.h"

#include <cstring>

#include "VXFile.h"

// Every Load reads into a copy and assigns it at the end, so that a short stream leaves the
// record as it was.

void SSelColor::Reset() {
  SSelCoreData::Reset();
  Mode = 0;
  Tolerance = 50;
  for (SVXColor& c : Colors) c.Value = 0x00FFFFFFu;
}

void SSelColor::Load(CVXFile* file, bool withCore) {
  SSelColor r(*this);
  uint32_t byteCount = 0;
  r.LoadHead_(file, withCore) >> r.Mode >> r.Tolerance >> byteCount;
  file->Read(r.Colors, sizeof r.Colors);
  *this = r;
}

void SSelColor::Store(CVXFile* file, bool withCore) {
  StoreHead_(file, withCore, 1, "SDC") << Mode << Tolerance << uint32_t{sizeof Colors};
  file->Write(Colors, sizeof Colors);
}

void SSelMask::Reset() {
  SSelCoreData::Reset();
  MaskMode = 0;
  std::memset(Cells, 1, sizeof Cells);
}

void SSelMask::Load(CVXFile* file, bool withCore) {
  SSelMask r(*this);
  uint32_t byteCount = 0;
  r.LoadHead_(file, withCore) >> r.MaskMode >> byteCount;
  file->Read(r.Cells, sizeof r.Cells);
  *this = r;
}

void SSelMask::Store(CVXFile* file, bool withCore) {
  StoreHead_(file, withCore, 1, "SMA") << MaskMode << uint32_t{sizeof Cells};
  file->Write(Cells, sizeof Cells);
}

void SSelMatch::Reset() {
  SSelCoreData::Reset();
  Method = 2;
  Precision = Weighting = 0;
  LumaWeight = 30;
  ColorWeight = 25;
  Rotate = Fast = false;
}

void SSelMatch::Load(CVXFile* file, bool withCore) {
  SSelMatch r(*this);
  r.Reset();
  CVXFile& f = r.LoadHead_(file, withCore) >> r.Method >> r.Precision >> r.Weighting >>
               r.LumaWeight >> r.ColorWeight;
  r.Rotate = ReadBool32_(f);
  if (r.Version >= 2) r.Fast = ReadBool32_(f);
  *this = r;
}

void SSelMatch::Store(CVXFile* file, bool withCore) {
  StoreHead_(file, withCore, 2, "SDMA") << Method << Precision << Weighting << LumaWeight
                                        << ColorWeight << uint32_t{Rotate} << uint32_t{Fast};
}
