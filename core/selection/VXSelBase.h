#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "MatchKernels.h"
#include "VXBase.h"
#include "VXMatchInfo.h"
#include "VXProperty.h"
#include "VXRegExp.h"
#include "VXSelFeatures.h"
#include "VXSelImageFeatures.h"
#include "VXSelPropFeatures.h"
#include "VXTable.h"
#include "WeightMatrix.h"
#include "bitvector.h"

class CVXCatFile;
class CVXEngine;
class CVXFile;
class CVXSelEngine;
class CVXSelector;
struct SVXFileDescriptor;

// The selection worker: holds loaded copies of the selector's feature records, narrows the
// candidates before the loop (PreSelect) and scores one candidate against the current original
// (Check), 0 to 100. It reads both through its selection engine, which owns it. Runs on the
// caller's thread and has no lock of its own; the engine calls it makes take the engine's.
class CVXSelBase : public CVXBase {
 public:
  explicit CVXSelBase(CVXSelEngine* selEngine);
  CVXSelBase(const CVXSelBase&) = delete;
  CVXSelBase& operator=(const CVXSelBase&) = delete;
  ~CVXSelBase() override;

  // Loads the feature records of `selector`. Throws CVXException* when the property table
  // cannot be read.
  virtual void Init(const CVXSelector& selector);
  // Prepares the match plug-ins named by the selector; false when one refuses.
  virtual bool InitPlugIns(const CVXSelector& selector,
                           const std::vector<SVXFileDescriptor>& originals);
  // Intersects `candidates` with what the record features allow. Throws CVXException* on a
  // failed engine call.
  virtual void PreSelect(CBitVector& candidates);
  // Scores the engine's current candidate against its current original. False: no hit.
  virtual bool Check(double& score, double minScore);

  // A shape record with what ScoreShapes prepares of it once per run.
  struct SPreparedShape {
    const SVXDBRec_3* Record = nullptr;  // not owned
    SVXQuickCells Quick;
  };
  // True when Check's verdict on a candidate against an original follows from their shape
  // records alone, the same whatever the running cut-off, and Check would change no state:
  // then ScoreShapes may score many pairs at once, on several threads.
  bool ScoresByShapesAlone() const;
  void PrepareShape(const SVXDBRec_3& record, SPreparedShape& prepared) const;
  // Check with a cut-off of 0 for `original` against each of `count` candidates: passed[j]
  // is 0 where Check rejects, and scores[j] holds the score. Only when ScoresByShapesAlone();
  // changes nothing, so that threads may call it at once.
  void ScoreShapes(const SPreparedShape& original, const SPreparedShape* candidates, size_t count,
                   double* scores, uint8_t* passed) const;

  // File-name comparisons (0 = same).
  double SmartMatchFileName(const char* a, const char* b) const;
  double LooseMatchFileName(const char* a, const char* b) const;
  bool PatternMatchFileName(const char* pattern, const char* name, double& score) const;

 protected:
  bool CheckLimits(double& score);
  bool CheckFileFormat(double& score);
  bool CheckCategories(double& score);
  bool CheckFolders(double& score);
  bool CheckFileName(double& score);
  bool CheckFileSize(double& score);
  bool CheckFileDateTime(double& score);
  bool CheckDimensions(double& score);
  bool CheckColor(double& score);
  bool CheckMatch(double& score);
  bool CheckPropRec(double& score);
  bool CheckPlugIns(double& score);

  // Property tests of one feature against one value.
  bool CheckProps(const SSelProps& selector, const CVXProperty& property, double& score);
  bool MatchPropString(const SSelProps& selector, const CVXProperty& property, double& score);
  bool MatchPropNum(const SSelProps& selector, const CVXProperty& property, double& score);
  bool MatchPropDate(const SSelProps& selector, const CVXProperty& property, double& score);
  bool MatchPropTime(const SSelProps& selector, const CVXProperty& property, double& score);
  bool MatchPropBool(const SSelProps& selector, const CVXProperty& property, double& score);
  bool MatchPropRef(const SSelProps& selector, const CVXProperty& property, double& score);

  // The shape comparisons of the run, on the original's and the candidate's records.
  double MatchDuplicates(const SVXDBRec_3& o, const SVXDBRec_3& c) const;
  double MatchHistogram();
  double MatchCSQuick(const SVXDBRec_3& o, const SVXDBRec_3& c) const;
  double MatchCSFuzzy(const SVXDBRec_3& o, const SVXDBRec_3& c) const;

  CVXSelEngine* SelEngine;  // the owner
  SSelLimits Limits;
  SSelFileFormat FileFormat;
  SSelFolders Folders;
  SSelCategories Categories;
  SSelFileName FileName;
  SSelFileSize FileSize;
  SSelFileDateTime FileDateTime;
  SSelDimensions Dimensions;
  SSelColor Color;
  SSelMatch Match;
  SSelMask Mask;
  SSelXMP XMP;
  std::vector<SSelProps> PropSelectors;
  CVXRegExp FileNameRegExp;  // also the pattern of word-mode string properties
  SVXWeightMatrix Weights;
  std::vector<std::string> PlugInIDs;
  CVXTable PropTable;
  std::map<std::string, uint32_t> PropColumns;  // column name to column OID
  std::vector<CVXProperty> PropDefaults;
  std::vector<CVXProperty> PropRow;
  double MinScore = 0;  // the cut-off last passed to Check
  bool PatternHasDot = false;

 private:
  // What the worker asks of one loaded match plug-in.
  class CPlugInLink {
   public:
    virtual ~CPlugInLink() = default;
    virtual std::string GetUnqiueID() const = 0;
    // `settings` is the feature blob, positioned behind its core block. 1 means ready.
    virtual unsigned MatchPrepare(CVXFile& settings, const uint32_t* oids, size_t count) = 0;
    // 200: `value` holds a score; 201: no opinion; anything else: failure.
    virtual unsigned Match(uint32_t original, uint32_t oid, float& value) = 0;
    // The plug-in scores a file on its own, without an original.
    virtual bool ScoresAlone() const = 0;
  };

  // The engine's loaded match plug-ins. This build loads none, so the list is empty and the
  // plug-in rows of Check never run; the plug-in host supplies the real list.
  std::vector<CPlugInLink*> MatchPlugIns_() const { return {}; }
  bool PlugInsTakePart_() const;

  CVXEngine& Engine_() const;
  // The original under test; an empty record when the run has none.
  const CVXCatFile& Original_() const;
  SVXMatchParams MatchParams_() const;
  // The score of CheckMatch for the methods that need no histogram.
  double MatchWithoutHistogram_(const SVXDBRec_3& o, const SVXDBRec_3& c) const;
  // Whether the method and its settings score by MatchCSQuickPrepared.
  bool QuickPrepared_() const;

  void LoadPropSelectors_(const CVXSelector& selector);
  void PreSelectXMP_(CBitVector& candidates);
  void PreSelectFormats_(CBitVector& candidates);
  void PreSelectCategories_(CBitVector& candidates);
  void PreSelectFolders_(CBitVector& candidates);
  void PreSelectOrientation_(CBitVector& candidates);
  // Format codes of the catalog originals.
  CBitVector OriginalFormats_();
  // The check of row 8 of Check, with Invert applied.
  bool CheckFileNameInverted_(double& score);
  bool MatchPropDateTime_(const SSelProps& selector, const CVXProperty& property, double& score,
                          unsigned type, int (CVXProperty::*compare)(double) const);
};
