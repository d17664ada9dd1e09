// The selection worker: feature records loaded per selection, the preselection by set
// operations, and the per-candidate checks with their averaged score.

#include "VXSelBase.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <set>

#include "VXCatFile.h"
#include "VXColor.h"
#include "VXEngine.h"
#include "VXException.h"
#include "VXLog.h"
#include "VXMemFile.h"
#include "VXNameMatch.h"
#include "VXResult.h"
#include "VXSelEngine.h"
#include "VXSelector.h"
#include "xstring.h"

namespace {

constexpr unsigned VX_PLUGIN_MATCH_PREPARE_FAILED = 13004;
constexpr unsigned kPlugInScored = 200;
constexpr unsigned kPlugInNoOpinion = 201;

// Resets the record, then loads it with its core block when the selector holds the key, so
// that a missing feature stays inactive.
void LoadRecord(const CVXSelector& selector, const std::string& key, SSelCoreData& record) {
  record.Reset();
  CVXMemFile blob;
  if (selector.GetFeature(key, blob)) record.Load(&blob, true);
}

void Require(unsigned rc) {
  if (rc != VX_OK) VX_THROW(rc);
}

CVXEngine::ESelectOp SelectOp(uint32_t op) {
  return op != 0 ? CVXEngine::soIntersect : CVXEngine::soUnion;
}

// `r` combined with a later condition's result `t` by the condition's Op: 1 or, 2 and, 3 and
// not. Op 0 marks an unused condition and is filtered out by the callers.
bool Combine(bool r, uint32_t op, bool t) {
  switch (op) {
    case 1:
      return r || t;
    case 2:
      return r && t;
    case 3:
      return r && !t;
    default:
      return r;
  }
}

// `r`, the result of the first condition, joined by the second and third by their Op.
template <typename Test>
bool JoinConditions(const SSelProps& selector, bool r, Test test) {
  for (uint32_t i = 1; i < SSelProps::kConditions; ++i) {
    const SSelProps::SCondition& c = selector.Conditions[i];
    if (c.Op != 0) r = Combine(r, c.Op, test(c));
  }
  return r;
}

// |trunc(a / b * 100 - 100)|: how many percent `a` lies away from `b`. Kept in floating point,
// where a zero `b` gives infinity or NaN, both of which fail every tolerance.
double PercentOff(double a, double b) { return std::fabs(std::trunc(a / b * 100 - 100)); }

double Capped(double score) { return std::min(std::fabs(std::trunc(score)), 100.0); }

int Diff(uint8_t a, uint8_t b) { return std::abs(int{a} - int{b}); }

}  // namespace

CVXSelBase::CVXSelBase(CVXSelEngine* selEngine) : SelEngine(selEngine) {}

CVXSelBase::~CVXSelBase() = default;

CVXEngine& CVXSelBase::Engine_() const { return *SelEngine->Engine(); }

const CVXCatFile& CVXSelBase::Original_() const {
  static const CVXCatFile kNone(0, "", 0);
  const CVXCatFile* original = SelEngine->GetCurrentOriginal();
  return original ? *original : kNone;
}

// ---- Loading the selection

void CVXSelBase::Init(const CVXSelector& selector) {
  PatternHasDot = false;
  PlugInIDs.clear();
  LoadRecord(selector, SSelLimits::kKey, Limits);
  LoadRecord(selector, SSelFolders::kKey, Folders);
  LoadRecord(selector, SSelCategories::kKey, Categories);
  LoadRecord(selector, SSelFileFormat::kKey, FileFormat);
  LoadRecord(selector, SSelFileSize::kKey, FileSize);
  LoadRecord(selector, SSelFileDateTime::kKey, FileDateTime);
  LoadRecord(selector, SSelDimensions::kKey, Dimensions);
  LoadRecord(selector, SSelFileName::kKey, FileName);
  PatternHasDot = FileName.Pattern.find('.') != std::string::npos;
  FileNameRegExp.SetPattern(FileName.Pattern);
  LoadRecord(selector, SSelColor::kKey, Color);
  Weights.Reset(0);
  LoadRecord(selector, SSelMatch::kKey, Match);
  Weights.Reset(Match.Weighting);
  LoadRecord(selector, SSelMask::kKey, Mask);
  // A mask replaces the matrix of the worker's comparisons only; the run's histograms keep the
  // engine's own weighting.
  if (Mask.Active) {
    Weights.SetMask(Mask.Cells);
    Match.Weighting = 3;
  }
  LoadPropSelectors_(selector);
  LoadRecord(selector, SSelXMP::kKey, XMP);
}

void CVXSelBase::LoadPropSelectors_(const CVXSelector& selector) {
  PropSelectors.clear();
  PropColumns.clear();
  PropDefaults.clear();
  PropRow.clear();
  for (const auto& feature : selector.Properties().Features) {
    if (feature.first.find(SSelProps::kKeyPrefix) == std::string::npos) continue;
    SSelProps props;
    LoadRecord(selector, feature.first, props);
    if (props.Active) PropSelectors.push_back(props);
  }
  if (PropSelectors.empty()) return;
  Require(Engine_().GetImagePropertiesTable(PropTable));
  for (const SVXColumn& column : PropTable.Columns()) {
    PropColumns[column.Name] = column.Id;
    PropDefaults.push_back(column.Default);
  }
  PropRow.resize(PropDefaults.size());
}

bool CVXSelBase::InitPlugIns(const CVXSelector& selector,
                             const std::vector<SVXFileDescriptor>& originals) {
  std::vector<uint32_t> oids;
  oids.reserve(originals.size());
  for (const SVXFileDescriptor& d : originals) oids.push_back(d.OID);
  for (CPlugInLink* plugIn : MatchPlugIns_()) {
    const std::string id = plugIn->GetUnqiueID();
    CVXMemFile blob;
    if (!selector.GetFeature(id, blob)) continue;
    SSelCoreData core;
    core.Reset();
    core.Load(&blob, true);
    if (!core.Active) continue;
    if (plugIn->MatchPrepare(blob, oids.data(), oids.size()) != 1) {
      VX_ERROR(Engine_().LogFile(), VX_PLUGIN_MATCH_PREPARE_FAILED, "MatchPrepare");
      return false;
    }
    PlugInIDs.push_back(id);
  }
  return true;
}

bool CVXSelBase::PlugInsTakePart_() const {
  return !MatchPlugIns_().empty() && !SelEngine->IsExternalMatch() && !PlugInIDs.empty();
}

// ---- Preselection

void CVXSelBase::PreSelect(CBitVector& candidates) {
  PreSelectXMP_(candidates);
  PreSelectFormats_(candidates);
  PreSelectCategories_(candidates);
  PreSelectFolders_(candidates);
  PreSelectOrientation_(candidates);
}

// A failed query leaves the candidates alone: the text index is optional.
void CVXSelBase::PreSelectXMP_(CBitVector& candidates) {
  if (!XMP.Active) return;
  std::vector<uint32_t> oids;
  const char* field = XMP.UseField ? XMP.Field.c_str() : nullptr;
  if (Engine_().FindXMPFTI(field, XMP.Query.c_str(), XMP.Flag, oids, 0, 0) != VX_OK) return;
  CBitVector found;
  for (uint32_t oid : oids) found.Set(oid);
  if (XMP.Exclude == 1) {
    candidates.AndNot(found);
  } else {
    candidates &= found;
  }
}

void CVXSelBase::PreSelectFormats_(CBitVector& candidates) {
  if (!FileFormat.Active) return;
  CBitVector formats;
  if (FileFormat.ListMode == 1) {
    if (FileFormat.Formats.IsEmpty()) return;
    formats = FileFormat.Formats;
  } else {
    if (SelEngine->GetOriginalImages().empty()) return;
    formats = OriginalFormats_();
  }
  CBitVector files;
  Require(Engine_().SelectFileFormats(formats, files));
  candidates &= files;
}

CBitVector CVXSelBase::OriginalFormats_() {
  CBitVector formats;
  for (const SVXFileDescriptor& d : SelEngine->GetOriginalImages()) {
    if (d.OID == 0) continue;
    CVXCatFile file;
    Require(Engine_().GetFile(d.OID, file));
    formats.Set(file.Properties().Format);
  }
  return formats;
}

void CVXSelBase::PreSelectCategories_(CBitVector& candidates) {
  if (!Categories.Active) return;
  CBitVector files;
  if (Categories.Mode == 1) {
    if (Categories.Categories.empty()) return;
    Require(Engine_().SelectCategories(Categories.Categories, SelectOp(Categories.Op), files));
  } else if (Categories.Mode == 0) {
    // Group OIDs reach up to the super category, so they are gathered in a set, not bits.
    std::set<uint32_t> groups;
    for (const SVXFileDescriptor& d : SelEngine->GetOriginalImages()) {
      std::vector<uint32_t> fileGroups;
      if (d.OID != 0 && Engine_().GetFileGroups(d.OID, fileGroups) == VX_OK) {
        groups.insert(fileGroups.begin(), fileGroups.end());
      }
    }
    if (groups.empty()) return;
    for (uint32_t group : groups) {
      std::vector<uint32_t> images;
      Require(Engine_().GetGroupImages(group, images));
      for (uint32_t oid : images) files.Set(oid);
    }
  } else if (Categories.Mode == 2) {
    const uint32_t active = SelEngine->GetSelector().Properties().ActiveCategory;
    if (active == 0) return;
    Require(Engine_().SelectCategories({active}, SelectOp(Categories.Op), files));
  } else {
    return;
  }
  candidates &= files;
}

// Mode 1 applies its list even when it is empty, which leaves no candidate.
void CVXSelBase::PreSelectFolders_(CBitVector& candidates) {
  if (!Folders.Active) return;
  CBitVector files;
  const bool recursive = Folders.Recursive != 0;
  if (Folders.Mode == 1) {
    Require(Engine_().SelectFolders(Folders.Folders, SelectOp(Folders.Op), recursive, files));
  } else {
    const uint32_t active = SelEngine->GetSelector().Properties().ActiveFolder;
    if (active == 0) return;
    Require(Engine_().SelectFolders({active}, CVXEngine::soUnion, recursive, files));
  }
  candidates &= files;
}

// Orientation 0 in relative mode narrows too: a relative size match never crosses
// orientations, so when all originals agree the other orientation can go before the loop.
void CVXSelBase::PreSelectOrientation_(CBitVector& candidates) {
  if (!Dimensions.Active) return;
  bool portrait = false;
  if (Dimensions.Orientation == 3 || Dimensions.Orientation == 2) {
    portrait = Dimensions.Orientation == 3;
  } else {
    const auto& originals = SelEngine->GetOriginalImages();
    if (Dimensions.Mode != 0 || originals.empty()) return;
    size_t landscape = 0;
    for (const SVXFileDescriptor& d : originals) {
      if (d.OID == 0) return;
      CVXCatFile file;
      Require(Engine_().GetFile(d.OID, file));
      if (file.Properties().Height < file.Properties().Width) ++landscape;
    }
    if (landscape != 0 && landscape != originals.size()) return;
    portrait = landscape == 0;
  }
  CBitVector files;
  Require(Engine_().SelectByOrientation(portrait, files));
  candidates &= files;
}

// ---- The candidate's score

bool CVXSelBase::Check(double& score, double minScore) {
  score = 0;
  MinScore = minScore;
  const bool plugIns = PlugInsTakePart_();
  // Cheap record checks first, image checks last: most candidates leave before their shape
  // record is read.
  struct SRow {
    bool run;
    bool (CVXSelBase::*check)(double&);
    bool gate;
  };
  const SRow rows[] = {
      {Limits.Active, &CVXSelBase::CheckLimits, false},
      {FileFormat.Active, &CVXSelBase::CheckFileFormat, false},
      {Folders.Active, &CVXSelBase::CheckFolders, false},
      {Categories.Active, &CVXSelBase::CheckCategories, false},
      {FileDateTime.Active, &CVXSelBase::CheckFileDateTime, true},
      {Dimensions.Active, &CVXSelBase::CheckDimensions, true},
      {FileSize.Active, &CVXSelBase::CheckFileSize, true},
      {FileName.Active, &CVXSelBase::CheckFileNameInverted_, true},
      {Limits.Option != 0 && plugIns, &CVXSelBase::CheckPlugIns, true},
      {Color.Active, &CVXSelBase::CheckColor, true},
      {Match.Active, &CVXSelBase::CheckMatch, true},
      {Limits.Option == 0 && plugIns, &CVXSelBase::CheckPlugIns, true},
      {!PropSelectors.empty(), &CVXSelBase::CheckPropRec, true},
  };
  const bool gated = Limits.Active && Limits.Mode == 1;
  double sum = 0;
  unsigned count = 0;
  for (const SRow& row : rows) {
    if (!row.run) continue;
    if (!(this->*row.check)(score)) return false;
    sum += score;
    ++count;
    if (row.gate && gated && score < Limits.MinScore) return false;
  }
  // No feature at all: every candidate is a full hit.
  score = count == 0 ? 100 : sum / count;
  return score >= MinScore;
}

bool CVXSelBase::CheckLimits(double& score) {
  score = 100;
  if (Limits.ExactDuplicates == 0) return true;
  const CVXCatFile::SData& c = SelEngine->GetCurrentFile().Properties();
  const CVXCatFile::SData& o = Original_().Properties();
  return c.CRC == o.CRC && c.Size == o.Size;
}

bool CVXSelBase::CheckFileFormat(double& score) {
  score = 100;
  const CVXCatFile& c = SelEngine->GetCurrentFile();
  const CVXCatFile& o = Original_();
  if (FileFormat.GrayScaleMode == 0 && c.IsGreyscale() != o.IsGreyscale()) return false;
  if (FileFormat.ListMode == 0) return c.Properties().Format == o.Properties().Format;
  return FileFormat.Formats.IsEmpty() || FileFormat.Formats.Get(c.Properties().Format);
}

// Folders and categories were decided in the preselection; they only count in the average.
bool CVXSelBase::CheckCategories(double& score) {
  score = 100;
  return true;
}

bool CVXSelBase::CheckFolders(double& score) { return CheckCategories(score); }

bool CVXSelBase::CheckFileSize(double& score) {
  const double size = SelEngine->GetCurrentFile().Properties().Size;
  if (FileSize.Mode == 0) {
    const double p = PercentOff(size, Original_().Properties().Size);
    if (!(p <= FileSize.TolerancePercent)) return false;
    score = Capped(100 - p);
    return true;
  }
  if (FileSize.Mode == 1) {
    score = 100;
    const double kb = size * 0.0009765625;
    return FileSize.MinKB <= kb && kb <= FileSize.MaxKB;
  }
  return false;
}

// Embedded times are compared whether or not their valid flag is set.
bool CVXSelBase::CheckFileDateTime(double& score) {
  const int64_t c = SelEngine->GetCurrentFile().Properties().EmbeddedTime;
  const int64_t o = Original_().Properties().EmbeddedTime;
  const SSelFileDateTime& t = FileDateTime;
  score = 100;
  if (t.Mode == 1) return t.From <= c && c <= t.To;
  if (t.Mode != 0) return false;
  switch (t.Relation) {
    case 1:
      return c <= o;
    case 2:
      return c >= o;
    case 0:
      break;
    default:
      return false;
  }
  static constexpr double kDaysPerUnit[] = {1, 7, 30, 365};
  const double days = std::fabs(std::trunc(static_cast<double>(o - c) / 86400));
  const double amount = t.Amount * (t.Unit < 4 ? kDaysPerUnit[t.Unit] : 1);
  switch (t.Direction) {
    case 0:
      return days <= amount;
    case 1:
      return c <= o && days <= amount;
    case 2:
      return c >= o && days <= amount;
    default:
      return false;
  }
}

bool CVXSelBase::CheckDimensions(double& score) {
  const CVXCatFile::SData& c = SelEngine->GetCurrentFile().Properties();
  const CVXCatFile::SData& o = Original_().Properties();
  const SSelDimensions& d = Dimensions;
  score = 100;
  if (d.Orientation == 1 && (c.Height >= c.Width) != (o.Height >= o.Width)) return false;
  if (d.Mode == 1) {
    return d.MinWidth <= c.Width && c.Width <= d.MaxWidth && d.MinHeight <= c.Height &&
           c.Height <= d.MaxHeight;
  }
  if (d.Mode != 0) return false;
  if (d.TolerancePercent >= 1000) return true;
  const double pw = PercentOff(c.Width, o.Width), ph = PercentOff(c.Height, o.Height);
  const double t = d.TolerancePercent;
  switch (d.SubMode) {
    case 0:
      // Two-sided: stays 100 until the two deviations add up to more than 100.
      score = Capped(200 - (pw + ph));
      return pw <= t && ph <= t;
    case 1:
      score = Capped(100 - pw);
      return pw <= t;
    case 2:
      score = Capped(100 - ph);
      return ph <= t;
    default:
      return true;
  }
}

// Colours of the query against the cells of the candidate. The copy's fourth byte marks a
// cell taken by a colour in the mode "anywhere"; in the stored record it is the shape value.
bool CVXSelBase::CheckColor(double& score) {
  SVXMatchInfo cells = SelEngine->GetCurrentShapeInfo()->Info;
  for (SVXMatchInfo::SCell& cell : cells.Cells) cell.Shape = 0;
  const double limit = 3 * std::min(std::ceil(Color.Tolerance * 2.55), 255.0);
  double sum = 0, n = 0;
  if (Color.Mode == 1) {
    // The palette is the first cell of each group of 20; each colour may take 20 cells.
    for (uint32_t k = 0; k < 400; k += 20) {
      if (Color.Colors[k].A == 0) continue;
      n += 5.0;
      uint8_t c1, c2, c3;
      RGB2C3(Color.Colors[k], c1, c2, c3);
      int taken = 0;
      for (uint32_t i = 0; i < 20 && taken < 20; ++i) {
        for (uint32_t j = i; j < 400 && taken < 20; j += 20) {
          SVXMatchInfo::SCell& cell = cells.Cells[j];
          if (cell.Shape != 0) continue;
          const double d = Diff(c1, cell.C1) * 1.2 + Diff(c2, cell.C2) + Diff(c3, cell.C3);
          if (d > limit) continue;
          cell.Shape = 255;
          sum += (765 - d) * 0.000326797385620915;  // 1 / 3060: 20 perfect cells give 5
          ++taken;
        }
      }
    }
    score = sum / n * 100;
  } else if (Color.Mode == 0) {
    for (uint32_t i = 0; i < 400; ++i) {
      if (Color.Colors[i].A == 0) continue;
      ++n;
      uint8_t c1, c2, c3;
      RGB2C3(Color.Colors[i], c1, c2, c3);
      const SVXMatchInfo::SCell& cell = cells.Cells[i];
      const double d = Diff(c3, cell.C3) + Diff(c1, cell.C1) * 0.5 + Diff(c2, cell.C2);
      if (d <= limit) sum += (765 - d) * 3.2679738562091506e-06;  // 1 / 306000
    }
    // No marked cell divides 0 by 0: the NaN fails every cut-off in Check.
    score = sum / (n * 0.0025) * 100;
  }
  return true;
}

bool CVXSelBase::CheckMatch(double& score) {
  static const SVXDBRec_3 kNoShape{};
  const SVXDBRec_3* original = SelEngine->GetOriginalShapeInfo();
  const SVXDBRec_3& o = original ? *original : kNoShape;
  const SVXDBRec_3& c = *SelEngine->GetCurrentShapeInfo();
  score = Match.Method == 1 ? MatchHistogram() : MatchWithoutHistogram_(o, c);
  // A strong colour weight lets the histogram have half the say.
  if (Match.Method != 0 && Match.ColorWeight >= 30) score = (MatchHistogram() + score) * 0.5;
  return true;
}

double CVXSelBase::MatchWithoutHistogram_(const SVXDBRec_3& o, const SVXDBRec_3& c) const {
  switch (Match.Method) {
    case 0:
      return MatchDuplicates(o, c);
    case 2:
      return Match.Precision == 0   ? MatchCSQuick(o, c)
             : Match.Precision == 1 ? MatchCSFuzzy(o, c)
                                    : 0;
    default:
      return 0;
  }
}

// Rows 1, 3, 4 and 11 of Check may run: Limits, folders and categories add a constant 100, and
// the match score comes from the records. A histogram is built per original and candidate by
// the engine, and the weighted Fast quick walk stops early by the running cut-off, so both keep
// to Check.
bool CVXSelBase::ScoresByShapesAlone() const {
  if (FileFormat.Active || FileDateTime.Active || Dimensions.Active || FileSize.Active ||
      FileName.Active || Color.Active || !PropSelectors.empty() || PlugInsTakePart_()) {
    return false;
  }
  if (!Match.Active || (Limits.Active && Limits.ExactDuplicates != 0)) return false;
  if (Match.Method == 1 || (Match.Method != 0 && Match.ColorWeight >= 30)) return false;
  const bool quick = Match.Method == 2 && Match.Precision == 0;
  return !(quick && Match.Fast && !Match.Rotate && MatchParams_().Weighted());
}

bool CVXSelBase::QuickPrepared_() const {
  return Match.Method == 2 && Match.Precision == 0 && !Match.Rotate && !MatchParams_().Weighted();
}

void CVXSelBase::PrepareShape(const SVXDBRec_3& record, SPreparedShape& prepared) const {
  prepared.Record = &record;
  if (QuickPrepared_()) prepared.Quick = PrepareQuick(record, Match.Fast);
}

// Check's rows in Check's order: limits, folders and categories add 100 each, exactly, and
// the match score comes last, so that the sum rounds as there.
void CVXSelBase::ScoreShapes(const SPreparedShape& original, const SPreparedShape* candidates,
                             size_t count, double* scores, uint8_t* passed) const {
  double constant = 0;
  unsigned rows = 1;
  for (bool active : {Limits.Active, Folders.Active, Categories.Active}) {
    if (active) {
      constant += 100;
      ++rows;
    }
  }
  const bool gated = Limits.Active && Limits.Mode == 1;
  const bool prepared = QuickPrepared_();
  const SVXMatchParams params = MatchParams_();
  // The match scores first, in scores; then each in its place among the rows.
  if (prepared) {
    constexpr size_t kAtOnce = 64;
    const SVXQuickCells* quick[kAtOnce];
    for (size_t at = 0; at < count; at += kAtOnce) {
      const size_t m = std::min(kAtOnce, count - at);
      for (size_t j = 0; j < m; ++j) quick[j] = &candidates[at + j].Quick;
      MatchCSQuickPreparedMany(original.Quick, quick, m, params, scores + at);
    }
  } else {
    for (size_t j = 0; j < count; ++j) {
      scores[j] = MatchWithoutHistogram_(*original.Record, *candidates[j].Record);
    }
  }
  for (size_t j = 0; j < count; ++j) {
    const double match = scores[j];
    passed[j] = !(gated && match < Limits.MinScore);
    scores[j] = (constant + match) / rows;
  }
}

bool CVXSelBase::CheckPlugIns(double& score) {
  score = 0;
  unsigned n = 0;
  for (CPlugInLink* plugIn : MatchPlugIns_()) {
    const std::string id = plugIn->GetUnqiueID();
    for (const std::string& wanted : PlugInIDs) {
      if (wanted != id) continue;
      const uint32_t original = plugIn->ScoresAlone() ? 0 : Original_().Oid();
      float value = 0;
      const unsigned answer = plugIn->Match(original, SelEngine->GetCurrentOID(), value);
      if (answer == kPlugInScored) {
        score += value;
        ++n;
      } else if (answer != kPlugInNoOpinion) {
        return false;
      }
    }
  }
  if (n > 0) score /= n;
  return true;
}

// ---- Shape comparisons

SVXMatchParams CVXSelBase::MatchParams_() const {
  SVXMatchParams p;
  p.SetWeights(Match.LumaWeight, Match.ColorWeight);
  p.Fast = Match.Fast;
  p.Rotate = Match.Rotate;
  p.Weighting = Match.Weighting;
  p.Weights = &Weights;
  p.MinScore = MinScore;
  return p;
}

double CVXSelBase::MatchDuplicates(const SVXDBRec_3& o, const SVXDBRec_3& c) const {
  return ::MatchDuplicates(o, c, MatchParams_());
}

double CVXSelBase::MatchHistogram() {
  double weight = 0;
  const CHist& o = SelEngine->GetOriginalHist(weight);
  return ::MatchHistogram(o, weight, SelEngine->GetCurrentHist());
}

double CVXSelBase::MatchCSQuick(const SVXDBRec_3& o, const SVXDBRec_3& c) const {
  return ::MatchCSQuick(o, c, MatchParams_());
}

double CVXSelBase::MatchCSFuzzy(const SVXDBRec_3& o, const SVXDBRec_3& c) const {
  return ::MatchCSFuzzy(o, c, MatchParams_());
}

// ---- File names

// Smart and loose matching rank and never reject: the gate in Check does that.
bool CVXSelBase::CheckFileName(double& score) {
  score = 0;
  const std::string& name = SelEngine->GetCurrentFile().Name();
  const char* original = Original_().Name().c_str();
  double d = 0;
  switch (FileName.Mode) {
    case 0:
      d = SmartMatchFileName(original, name.c_str());
      break;
    case 1:
      d = LooseMatchFileName(original, name.c_str());
      break;
    case 2: {
      const std::string subject = PatternHasDot ? name : VXNameMatch::CutExtension(name);
      if (FileNameRegExp.Match(subject) != CVXRegExp::reMatch) return false;
      score = 100;
      return true;
    }
    case 3:
      return PatternMatchFileName(FileName.Pattern.c_str(), name.c_str(), score);
    default:
      return false;
  }
  score = d <= 0.5 ? 100 : std::max(100 - 5 * d, 0.0);
  return true;
}

bool CVXSelBase::CheckFileNameInverted_(double& score) {
  const bool result = CheckFileName(score);
  if (FileName.Invert == 0) return result;
  if (!result) score = 100;
  return !result;
}

double CVXSelBase::SmartMatchFileName(const char* a, const char* b) const {
  return VXNameMatch::SmartMatchFileName(a, b);
}

double CVXSelBase::LooseMatchFileName(const char* a, const char* b) const {
  return VXNameMatch::LooseMatchFileName(a, b);
}

bool CVXSelBase::PatternMatchFileName(const char* pattern, const char* name, double& score) const {
  return VXNameMatch::PatternMatchFileName(pattern, name, score);
}

// ---- Properties

bool CVXSelBase::CheckPropRec(double& score) {
  if (PropRow.empty() || PropColumns.empty()) return false;
  const unsigned rc = Engine_().GetImageProperties(SelEngine->GetCurrentOID(), PropRow);
  if (rc == VX_NOT_FOUND) {
    PropRow = PropDefaults;  // a file without a row has the column defaults
  } else if (rc != VX_OK) {
    return false;
  }
  bool ok = true;
  unsigned n = 0;
  for (const SSelProps& selector : PropSelectors) {
    const auto column = PropColumns.find(selector.Column);
    const CVXProperty* value = nullptr;
    // A column the table lacks fails the selector as a failed condition does.
    // NOLINTNEXTLINE(bugprone-branch-clone)
    if (column == PropColumns.end()) {
      ok = false;
    } else if (!PropTable.GetColumnData(column->second, PropRow, value)) {
      score = 0;
      ok = false;
      VX_WARN(Engine_().LogFile(), "Failed to map column OID");
    } else if (CheckProps(selector, *value, score)) {
      ++n;
    } else if (Limits.PropsAny == 0) {
      ok = false;
    }
    if (Limits.PropsAny == 1 && n > 0) {
      score = 100;
      return true;
    }
    if (!ok) return false;
  }
  return n >= 1;
}

bool CVXSelBase::CheckProps(const SSelProps& selector, const CVXProperty& property, double& score) {
  score = 100;
  switch (selector.DataType) {
    case vptString:
    case vptLongText:
      return MatchPropString(selector, property, score) != (selector.Invert != 0);
    case vptInt32:
    case vptUInt32:
    case vptInt64:
    case vptFloat:
    case vptDouble:
    case vptUInt64:
      return MatchPropNum(selector, property, score);
    case vptDate:
      return MatchPropDate(selector, property, score);
    case vptTime:
      return MatchPropTime(selector, property, score);
    case vptBool:
      return MatchPropBool(selector, property, score);
    case vptReference:
      return MatchPropRef(selector, property, score);
    default:
      return false;
  }
}

// Word mode: the condition's words are regular expressions tried on each word of the value;
// "+word" must match, "-word" must not, and of the plain words one is enough.
bool CVXSelBase::MatchPropString(const SSelProps& selector, const CVXProperty& property, double&) {
  const SSelProps::SCondition& first = selector.Conditions[0];
  const std::string s = _mbsupr(property.String());
  const std::string p = _mbsupr(first.Value.String());
  if (first.MatchMode == 1) return s.find(p) != std::string::npos;
  if (first.MatchMode != 0) return s.empty();
  const std::vector<std::string> words = VXNameMatch::SplitWords(p);
  size_t plus = 0, minus = 0, plain = 0;
  for (const std::string& word : words) {
    (word[0] == '+' ? plus : word[0] == '-' ? minus : plain)++;
  }
  if (s.empty()) return plus == 0 && minus == words.size();
  const std::vector<std::string> values = VXNameMatch::SplitWords(s);
  size_t hitsPlus = 0, passMinus = 0, hits = 0;
  for (const std::string& word : words) {
    const bool isPlus = word[0] == '+', isMinus = word[0] == '-';
    if (FileNameRegExp.SetPattern(isPlus || isMinus ? word.substr(1) : word) !=
        CVXRegExp::rePatternOK) {
      return false;
    }
    const auto matches =
        static_cast<size_t>(std::count_if(values.begin(), values.end(), [&](const auto& v) {
          return FileNameRegExp.Match(v) == CVXRegExp::reMatch;
        }));
    if (isMinus) {
      if (matches > 0) return false;
      ++passMinus;
    } else {
      hits += matches;
      if (isPlus) hitsPlus += matches;
    }
  }
  return plus <= hitsPlus && minus <= passMinus && (plain == 0 || hits > 0);
}

// An empty value with MatchEmpty counts as 0.
bool CVXSelBase::MatchPropNum(const SSelProps& selector, const CVXProperty& property,
                              double& score) {
  if (property.IsEmpty() && !selector.MatchEmpty) {
    score = 0;
    return false;
  }
  const double x = property.Double();
  const auto inRange = [x](const SSelProps::SCondition& c) {
    return c.Low.Double() <= x && x <= c.High.Double();
  };
  return JoinConditions(selector, inRange(selector.Conditions[0]), inRange);
}

bool CVXSelBase::MatchPropDate(const SSelProps& selector, const CVXProperty& property,
                               double& score) {
  return MatchPropDateTime_(selector, property, score, vptDate, &CVXProperty::CompareDate);
}

bool CVXSelBase::MatchPropTime(const SSelProps& selector, const CVXProperty& property,
                               double& score) {
  return MatchPropDateTime_(selector, property, score, vptTime, &CVXProperty::CompareTime);
}

// An empty value has type 0 and so never passes, whatever MatchEmpty says. An empty limit does
// not bind.
bool CVXSelBase::MatchPropDateTime_(const SSelProps& selector, const CVXProperty& property,
                                    double& score, unsigned type,
                                    int (CVXProperty::*compare)(double) const) {
  if ((property.IsEmpty() && !selector.MatchEmpty) || property.Type() != type) {
    score = 0;
    return false;
  }
  const double x = property.Double();
  const auto inRange = [&](const SSelProps::SCondition& c) {
    return !((!c.Low.IsEmpty() && (c.Low.*compare)(x) > 0) ||
             (!c.High.IsEmpty() && (c.High.*compare)(x) < 0));
  };
  return JoinConditions(selector, inRange(selector.Conditions[0]), inRange);
}

// Flags of the first condition: bit 0 true matches, bit 1 false matches, bit 2 empty matches.
bool CVXSelBase::MatchPropBool(const SSelProps& selector, const CVXProperty& property,
                               double& score) {
  score = 100;
  const uint32_t flags = selector.Conditions[0].Flags;
  if (property.IsEmpty()) return (flags & 4) != 0;
  if (property.Type() != vptBool) return true;
  switch (property.Int64()) {
    case 1:
      return (flags & 1) != 0;
    case 0:
      return (flags & 2) != 0;
    default:
      return false;
  }
}

// The first condition's Op 3 negates it; MatchMode 2 of the first condition lets an empty
// reference pass.
bool CVXSelBase::MatchPropRef(const SSelProps& selector, const CVXProperty& property,
                              double& score) {
  const SSelProps::SCondition& first = selector.Conditions[0];
  if (property.IsEmpty() && first.MatchMode == 2) {
    score = 100;
    return true;
  }
  if (property.Type() != vptReference) {
    score = 0;
    return false;
  }
  const uint64_t v = property.UInt64();
  const auto equal = [v](const SSelProps::SCondition& c) { return c.Value.UInt64() == v; };
  return JoinConditions(selector, equal(first) != (first.Op == 3), equal);
}
