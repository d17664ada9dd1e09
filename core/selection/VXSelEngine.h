#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "Hist.h"
#include "VXBase.h"
#include "VXCatFile.h"
#include "VXMatchInfo.h"
#include "VXResultSet.h"
#include "VXSelFeatures.h"
#include "VXSelImageFeatures.h"
#include "VXSelector.h"
#include "VXURI.h"
#include "bitvector.h"

class CVXBitmap;
class CVXEngine;
class CVXSelBase;
class CVXSelBlockScorer;

// An image that candidates are compared with. OID 0: a file the catalog does not hold.
struct SVXFileDescriptor {
  uint32_t OID = 0;
  uint32_t Folder = 0;
  CVXURI URI;
};

// Runs a selection: narrows the catalog's files to candidates, visits each once, lets the
// workers score it against every original and keeps the best hits per original. A client
// derives from it to hear progress (Feedback), to cancel, and to supply external originals
// (CreateVXFile).
//
// Runs on the caller's thread; shape records are read ahead on one short-lived thread at a
// time. The read-ahead block is process-wide: two runs in one process must not overlap.
class CVXSelEngine : public CVXBase {
 public:
  enum EState {
    Started = 0,         // argument: number of originals
    PreselectBegin = 1,  // candidates times originals
    PreselectEnd = 2,    // candidates times originals
    Progress = 3,        // percent
    Finished = 4,
    ResultPrepare = 5,  // number of result entries
    ResultReady = 6,
    Failed = 7,
    Cancelled = 8,
  };

  // `engine` is not owned and must outlive the selection engine. Makes one worker.
  explicit CVXSelEngine(CVXEngine* engine);
  CVXSelEngine(const CVXSelEngine&) = delete;
  CVXSelEngine& operator=(const CVXSelEngine&) = delete;
  ~CVXSelEngine() override;

  // Hooks. False from Feedback cancels the run where the run asks.
  virtual bool Feedback(EState state, unsigned long value) const;
  virtual unsigned GetVXBitmap(const std::string& path, CVXBitmap& bitmap, bool thumb, int width,
                               int height, bool keepAspect);
  virtual unsigned InitSelection(const CVXSelector& selector,
                                 const std::vector<SVXFileDescriptor>& originals);
  virtual bool Aborted() const { return aborted_; }
  virtual unsigned Run(CVXResultSet& result);
  // Rescales scores above 100, sorts, applies MinScore and MaxResults; returns the lowest score
  // kept, which becomes the running cut-off.
  virtual double ResultCutOff(SVXResultSetEntry& entry);
  virtual unsigned PrepareResult(SVXResultSetEntry& entry);
  // Fills the record (and, when `shape` is not null, the shape record) of an original. The
  // default reads catalog files and answers 10008 for OID 0.
  virtual unsigned CreateVXFile(const SVXFileDescriptor& descriptor, CVXCatFile& file,
                                SVXDBRec_3* shape);

  CVXEngine* Engine() const { return engine_; }
  const CVXSelector& GetSelector() const { return selector_; }
  const std::vector<SVXFileDescriptor>& GetOriginalImages() const { return originals_; }
  bool IsExternalMatch() const { return externalMatch_; }
  const CVXCatFile& GetCurrentFile() const { return currentFile_; }
  uint32_t GetCurrentOID() const { return currentOid_; }
  const CVXCatFile* GetCurrentOriginal() const { return currentOriginal_; }
  const SVXResultSetEntry* GetCurrentEntry() const { return currentEntry_; }

  // Shape records for the checks. The candidate's comes from the read-ahead banks; a record
  // that cannot be had is the zeroed EmptyShape, with Result 10020.
  const SVXDBRec_3* GetCurrentShapeInfo();
  const SVXDBRec_3* GetOriginalShapeInfo() const { return originalShape_; }
  // Histograms with the run's weighting; the original's is kept per result entry.
  const CHist& GetOriginalHist(double& weight);
  const CHist& GetCurrentHist();

 protected:
  // Workers are owned; a derived engine may add more after the constructor's one.
  std::vector<std::unique_ptr<CVXSelBase>>& Workers() { return workers_; }
  // Threads, the caller's included, that may score candidates against many originals at once
  // when the only worker scores by shape records alone; the result and the feedback are those
  // of scoring on the caller's thread. 1 keeps every run on that thread. Default: one per
  // processor.
  void SetScoringThreads(unsigned threads) { scoringThreads_ = threads < 1 ? 1 : threads; }

 private:
  void ResetRun_(CVXResultSet& result);
  // Steps from the Started report to the prepared result; throws on failure.
  void RunStages_(CVXResultSet& result, bool needsShape);
  void EndPreselection_(const CBitVector& candidates, size_t originals);
  uint32_t CutOffInterval_(size_t originals) const;
  void MakeEntries_(CVXResultSet& result);
  void SelectExactDuplicates_(CVXResultSet& result, CBitVector& candidates);
  void MakeCandidates_(const CBitVector& candidates, bool needsShape);
  unsigned LoadOrgShapes(CVXResultSet& result);
  void MainLoop_(CVXResultSet& result, bool needsShape);
  // CurrentFile from the window of candidate records, reading the next window when it is done.
  unsigned ReadCurrentFile_();
  void ScoreWithoutOriginals_(CVXResultSet& result);
  void ScoreWithOriginals_(CVXResultSet& result, const CVXURI& uri, bool needsShape);
  // The candidate from the scores of its block, with the outcome of ScoreWithOriginals_.
  void ScoreFromBlock_(CVXResultSet& result, const CVXURI& uri);
  // Scores the current candidate and those after it whose records the bank holds.
  void ScoreBlock_(const SVXDBRec_3* shape);
  void StartBlockScoring_(CVXResultSet& result, bool needsShape);
  // Makes entry i the current one; false when it is the candidate itself.
  bool EnterEntry_(std::vector<SVXResultSetEntry>& entries, size_t i, const CVXURI& uri,
                   bool needsShape);
  bool IsCandidate_(const SVXResultSetEntry& entry, const CVXURI& uri) const;
  // The cut-off that entry i's checks must reach.
  double MinScoreOf_(size_t i) const { return cutOffInForce_ ? entryCutOffs_[i] : 0; }
  // Applies the grey-scale penalty to the sum of entry i and keeps the hit if it makes the cut.
  void AddHit_(SVXResultSetEntry& entry, size_t i, double sum);
  bool SumWorkers_(double minScore, double& sum);
  void PrepareResults_(CVXResultSet& result);
  void Finish_(CVXResultSet& result);
  bool ReportProgress_(unsigned percent, bool atLeastOneSecond);
  const SVXDBRec_3* FindCurrentShape_();
  // Passes `go` through; false cancels the run and says so.
  bool Cancel_(bool go);

  bool aborted_ = false;
  CVXEngine* engine_;  // not owned
  CVXSelector selector_;
  std::vector<SVXFileDescriptor> originals_;
  bool externalMatch_ = false;
  std::vector<std::unique_ptr<CVXSelBase>> workers_;
  SSelLimits limits_;
  SSelMatch match_;
  SSelFileFormat fileFormat_;
  unsigned result_ = 10001;
  uint32_t currentOid_ = 0;
  CVXCatFile currentFile_;
  const CVXCatFile* currentOriginal_ = nullptr;
  SVXResultSetEntry* currentEntry_ = nullptr;
  bool currentHistValid_ = false;
  SVXDBRec_3 emptyShape_{};
  const SVXDBRec_3* originalShape_ = nullptr;
  std::vector<SVXDBRec_3> originalShapes_;
  CHist currentHist_;
  std::vector<uint32_t> candidates_;
  size_t candidatePos_ = 0;
  // Records of the candidates from windowFirst_ on, with GetFile's code for each.
  std::vector<CVXCatFile> fileWindow_;
  std::vector<unsigned> fileCodes_;
  size_t windowFirst_ = 0;
  uint64_t windowChanges_ = 0;  // the engine's Changes() before the window was read
  std::unordered_map<uint32_t, const SVXDBRec_3*> shapeCache_;  // the bank last read
  // The record GetCurrentShapeInfo last gave, for that OID; null after a reset.
  const SVXDBRec_3* currentShape_ = nullptr;
  uint32_t currentShapeOid_ = 0;
  std::map<uint32_t, std::pair<CHist, double>> originalHists_;
  std::unique_ptr<uint8_t[]> shapeBuffer_;
  // Progress bookkeeping of the current stage.
  unsigned lastPercent_ = 0;
  int64_t lastReportMs_ = 0;
  uint32_t interval_ = 0;
  bool cutOffInForce_ = false;
  std::vector<double> entryCutOffs_;  // running cut-off per result entry
  unsigned scoringThreads_;
  std::unique_ptr<CVXSelBlockScorer> scorer_;  // only while a run scores by blocks
  size_t blockFirst_ = 0;                      // candidate position of the block's first
  std::vector<double> blockFloors_;            // the cut-offs the block was scored with
  bool floorsBroken_ = false;                  // a cut-off fell below its floor: no more floors
};
