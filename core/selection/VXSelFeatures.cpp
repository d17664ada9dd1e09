#include "VXSelFeatures.h"

#include <algorithm>
#include <ctime>

#include "VXFile.h"

// Every Load reads into a copy and assigns it at the end, so that a short stream leaves the
// record as it was.

namespace {

// Local time of a broken-down date, the fields taken as they stand: mktime normalises a month
// field of 12 into January of the next year.
uint32_t LocalTime(int year, int month, int day) {
  std::tm t{};
  t.tm_year = year;
  t.tm_mon = month;
  t.tm_mday = day;
  return static_cast<uint32_t>(std::mktime(&t));
}

}  // namespace

void SSelFileFormat::Reset() {
  SSelCoreData::Reset();
  Formats = CBitVector();
  ListMode = 1;
  GrayScaleMode = 1;
}

void SSelFileFormat::Load(CVXFile* file, bool withCore) {
  SSelFileFormat r(*this);
  r.LoadHead_(file, withCore) >> r.Formats >> r.ListMode >> r.GrayScaleMode;
  *this = r;
}

void SSelFileFormat::Store(CVXFile* file, bool withCore) {
  StoreHead_(file, withCore, 1, "SFF") << Formats << ListMode << GrayScaleMode;
}

void SSelFolders::Reset() {
  SSelCoreData::Reset();
  Mode = Op = 0;
  Recursive = 0;
  Folders.clear();
}

void SSelFolders::Load(CVXFile* file, bool withCore) {
  SSelFolders r(*this);
  CVXFile& f = r.LoadHead_(file, withCore);
  r.Folders = ReadOids_(f);
  f >> r.Op >> r.Recursive;
  r.Mode = 1;
  if (r.Version >= 2) f >> r.Mode;
  *this = r;
}

void SSelFolders::Store(CVXFile* file, bool withCore) {
  CVXFile& f = StoreHead_(file, withCore, 2, "SFL");
  WriteOids_(f, Folders);
  f << Op << Recursive << Mode;
}

void SSelCategories::Reset() {
  SSelCoreData::Reset();
  Mode = Op = 0;
  Categories.clear();
}

void SSelCategories::Load(CVXFile* file, bool withCore) {
  SSelCategories r(*this);
  CVXFile& f = r.LoadHead_(file, withCore) >> r.Mode;
  r.Categories = ReadOids_(f);
  f >> r.Op;
  *this = r;
}

void SSelCategories::Store(CVXFile* file, bool withCore) {
  CVXFile& f = StoreHead_(file, withCore, 1, "SCT") << Mode;
  WriteOids_(f, Categories);
  f << Op;
}

void SSelFileName::Reset() {
  SSelCoreData::Reset();
  Mode = Invert = 0;
  Pattern.clear();
}

void SSelFileName::Load(CVXFile* file, bool withCore) {
  SSelFileName r(*this);
  CVXFile& f = r.LoadHead_(file, withCore) >> r.Mode >> r.Pattern;
  r.Invert = 0;
  if (r.Version >= 2) f >> r.Invert;
  r.NeedsOriginals = r.Mode <= 1;
  *this = r;
}

void SSelFileName::Store(CVXFile* file, bool withCore) {
  NeedsOriginals = Mode <= 1;
  StoreHead_(file, withCore, 2, "SFN") << Mode << Pattern << Invert;
}

void SSelFileSize::Reset() {
  SSelCoreData::Reset();
  Mode = 0;
  MaxKB = 131072;
  MinKB = 0;
  TolerancePercent = 10;
}

void SSelFileSize::Load(CVXFile* file, bool withCore) {
  SSelFileSize r(*this);
  r.LoadHead_(file, withCore) >> r.MaxKB >> r.MinKB >> r.TolerancePercent >> r.Mode;
  *this = r;
}

void SSelFileSize::Store(CVXFile* file, bool withCore) {
  StoreHead_(file, withCore, 1, "SFS") << MaxKB << MinKB << TolerancePercent << Mode;
}

// The month fields count from zero, so these are 1 February 1970 and 31 January 2037.
void SSelFileDateTime::Reset() {
  SSelCoreData::Reset();
  Mode = Relation = Amount = Unit = Direction = 0;
  From = LocalTime(70, 1, 1);
  To = LocalTime(136, 12, 31);
}

void SSelFileDateTime::Load(CVXFile* file, bool withCore) {
  SSelFileDateTime r(*this);
  r.LoadHead_(file, withCore) >> r.Relation >> r.Mode >> r.Amount >> r.Unit >> r.Direction >>
      r.From >> r.To;
  *this = r;
}

void SSelFileDateTime::Store(CVXFile* file, bool withCore) {
  StoreHead_(file, withCore, 1, "SDT")
      << Relation << Mode << Amount << Unit << Direction << From << To;
}

void SSelLimits::Reset() {
  SSelCoreData::Reset();
  Mode = 1;
  ExactDuplicates = 0;
  MinScore = 75;
  Reserved = 50;
  MaxResults = 500;
  DropEmpty = PropsAny = 0;
}

void SSelLimits::Load(CVXFile* file, bool withCore) {
  SSelLimits r(*this);
  CVXFile& f = r.LoadHead_(file, withCore) >> r.ExactDuplicates >> r.Mode >> r.MinScore >>
               r.Reserved >> r.MaxResults >> r.DropEmpty;
  r.PropsAny = 0;
  if (r.Version >= 2) f >> r.PropsAny;
  r.MaxResults = std::min(r.MaxResults, kMaxResultsCap);
  if (r.Version == 2 && r.MaxResults == 1) r.MaxResults = 500;
  *this = r;
}

void SSelLimits::Store(CVXFile* file, bool withCore) {
  StoreHead_(file, withCore, 3, "SLM")
      << ExactDuplicates << Mode << MinScore << Reserved << MaxResults << DropEmpty << PropsAny;
}

void SSelDimensions::Reset() {
  SSelCoreData::Reset();
  Mode = SubMode = Orientation = 0;
  TolerancePercent = 1000;
  MaxHeight = MaxWidth = 10000;
  MinHeight = MinWidth = 0;
}

void SSelDimensions::Load(CVXFile* file, bool withCore) {
  SSelDimensions r(*this);
  r.LoadHead_(file, withCore) >> r.TolerancePercent >> r.MaxHeight >> r.MinHeight >> r.MaxWidth >>
      r.MinWidth >> r.Mode >> r.Orientation >> r.SubMode;
  *this = r;
}

void SSelDimensions::Store(CVXFile* file, bool withCore) {
  StoreHead_(file, withCore, 1, "SDM") << TolerancePercent << MaxHeight << MinHeight << MaxWidth
                                       << MinWidth << Mode << Orientation << SubMode;
}
