// The selection run: preselection, the candidate loop with its read-ahead of shape records, the
// cut-off of the hit lists and the progress protocol.

#include "VXSelEngine.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstring>
#include <thread>

#include "VXEngine.h"
#include "VXException.h"
#include "VXLog.h"
#include "VXResult.h"
#include "VXSelBase.h"
#include "VXSelBlockScorer.h"
#include "VXSelPrefetch.h"
#include "xstring.h"

namespace {

constexpr unsigned VX_PLUGIN_PREPARE_FAILED = 13001;

// Scoring by blocks pays from this many originals on; a block holds up to this many candidates,
// whose records stay in the core's cache while each original is read once.
constexpr size_t kBlockScoringOriginals = 32;
constexpr size_t kBlockCandidates = 32;

// Candidate records are read this many at a time under one hold of the engine's lock.
constexpr size_t kFileWindow = kPrefetchBankRecords;

int64_t NowMs() {
  using namespace std::chrono;
  return duration_cast<milliseconds>(steady_clock::now().time_since_epoch()).count();
}

unsigned Percent(size_t done, size_t total) {
  return static_cast<unsigned>(std::min<size_t>(done * 100 / std::max<size_t>(total, 1), 100));
}

// Loads a feature record with its core block when the selector holds the key.
void LoadFeature(const CVXSelector& selector, const char* key, SSelCoreData& record) {
  record.Reset();
  CVXMemFile blob;
  if (selector.GetFeature(key, blob)) record.Load(&blob, true);
}

bool SameLocation(const CVXURI& a, const CVXURI& b) {
  return a.IsFolder() == b.IsFolder() && _mbsicmp(a.AsString().c_str(), b.AsString().c_str()) == 0;
}

}  // namespace

CVXSelEngine::CVXSelEngine(CVXEngine* engine)
    : engine_(engine), scoringThreads_(std::max(1u, std::thread::hardware_concurrency())) {
  workers_.push_back(std::make_unique<CVXSelBase>(this));
}

CVXSelEngine::~CVXSelEngine() = default;

bool CVXSelEngine::Feedback(EState, unsigned long) const { return true; }

unsigned CVXSelEngine::GetVXBitmap(const std::string&, CVXBitmap&, bool, int, int, bool) {
  return VX_NEUTRAL_FAILURE;
}

unsigned CVXSelEngine::CreateVXFile(const SVXFileDescriptor& descriptor, CVXCatFile& file,
                                    SVXDBRec_3*) {
  if (descriptor.OID == 0) return VX_NO_FILE_OID;
  unsigned rc = engine_->GetFile(descriptor.OID, file);
  if (rc != VX_OK) VX_ERROR(engine_->LogFile(), rc, "CreateVXFile");
  return rc;
}

unsigned CVXSelEngine::InitSelection(const CVXSelector& selector,
                                     const std::vector<SVXFileDescriptor>& originals) {
  try {
    result_ = VX_OK;
    selector_ = selector;
    originals_ = originals;
    currentOid_ = 0;
    currentOriginal_ = nullptr;
    currentEntry_ = nullptr;
    originalShape_ = nullptr;
    originalShapes_.clear();
    shapeCache_.clear();
    currentShape_ = nullptr;
    externalMatch_ = std::any_of(originals_.begin(), originals_.end(), [](const auto& d) {
      return d.OID == 0 && !d.URI.AsString().empty();
    });
    LoadFeature(selector_, SSelLimits::kKey, limits_);
    LoadFeature(selector_, SSelMatch::kKey, match_);
    LoadFeature(selector_, SSelFileFormat::kKey, fileFormat_);
    SSelFileName fileName;
    LoadFeature(selector_, SSelFileName::kKey, fileName);
    selector_.Properties().NeedsOriginals |= fileName.NeedsOriginals;
    for (auto& worker : workers_) worker->Init(selector_);
    if (!externalMatch_) {
      for (auto& worker : workers_) {
        if (!worker->InitPlugIns(selector_, originals_)) VX_THROW(VX_PLUGIN_PREPARE_FAILED);
      }
    }
    if (!selector_.Properties().NeedsOriginals) originals_.clear();
  } catch (...) {
    result_ = VXCodeOfCurrentException(engine_->LogFile(), __LINE__, __FILE__);
  }
  return result_;
}

// ---- Run

unsigned CVXSelEngine::Run(CVXResultSet& result) {
  VX_LOG(engine_->LogFile(), 3, "Selection Run started");
  ResetRun_(result);
  const bool needsShape = selector_.NeedsVXShapeData();
  shapeBuffer_ = std::make_unique<uint8_t[]>(2 * kPrefetchBankBytes);
  for (size_t i = 0; i < 2 * kPrefetchBankRecords; ++i) {
    std::memset(shapeBuffer_.get() + i * kShapeRecordBytes, 0, kShapeRecordBytes);
  }
  result.Properties().DropEmpty = limits_.DropEmpty != 0;
  if (originals_.empty() && selector_.Properties().NeedsOriginals) return VX_NEUTRAL_FAILURE;
  try {
    RunStages_(result, needsShape);
  } catch (...) {
    result_ = VXCodeOfCurrentException(engine_->LogFile(), __LINE__, __FILE__);
  }
  // Clean-up, also after an exception: no reading thread may outlive the buffer.
  StopPrefetch();
  scorer_.reset();
  shapeBuffer_.reset();
  originalShapes_.clear();
  shapeCache_.clear();
  currentShape_ = nullptr;
  Finish_(result);
  VX_LOG(engine_->LogFile(), 3, "Done");
  return result_;
}

void CVXSelEngine::ResetRun_(CVXResultSet& result) {
  aborted_ = false;
  result_ = VX_OK;
  currentOid_ = 0;
  candidatePos_ = 0;
  currentHistValid_ = false;
  cutOffInForce_ = false;
  result.Clear();
  originalShapes_.clear();
  originalHists_.clear();
  shapeCache_.clear();
  currentShape_ = nullptr;
  candidates_.clear();
  shapeBuffer_.reset();
}

void CVXSelEngine::RunStages_(CVXResultSet& result, bool needsShape) {
  const size_t n = originals_.size();
  Feedback(Started, n);
  CBitVector candidates;
  if (unsigned rc = engine_->GetFiles(candidates); rc != VX_OK) VX_THROW(rc);
  interval_ = CutOffInterval_(n);
  const unsigned long work = candidates.Count() * std::max<size_t>(n, 1);
  Feedback(PreselectBegin, work);
  for (auto& worker : workers_) worker->PreSelect(candidates);
  MakeEntries_(result);
  if (aborted_) return EndPreselection_(candidates, n);
  if (limits_.ExactDuplicates) {
    SelectExactDuplicates_(result, candidates);
    if (aborted_) return EndPreselection_(candidates, n);
  }
  MakeCandidates_(candidates, needsShape);
  if (needsShape && !limits_.ExactDuplicates && selector_.Properties().NeedsOriginals &&
      LoadOrgShapes(result) != VX_OK) {
    VX_ERROR(engine_->LogFile(), result_, "Failed to load original shape info cache");
    VX_THROW(result_);
  }
  EndPreselection_(candidates, n);
  VX_LOG(engine_->LogFile(), 3, "  Preselection finished");
  MainLoop_(result, needsShape);
  VX_LOG(engine_->LogFile(), 3, "  Main Selection finished");
  if (result_ == VX_OK && !aborted_) PrepareResults_(result);
}

void CVXSelEngine::EndPreselection_(const CBitVector& candidates, size_t originals) {
  Feedback(Progress, 100);
  Feedback(PreselectEnd, candidates.Count() * std::max<size_t>(originals, 1));
}

uint32_t CVXSelEngine::CutOffInterval_(size_t originals) const {
  if (limits_.MaxResults > 1000) return 1000;
  if (originals > 2000) return 100;
  if (originals > 500) return 200;
  if (originals > 100) return 500;
  if (originals > 10) return 1000;
  if (originals > 5) return 3000;
  return 5000;
}

// A progress report of a stage: when the percent changed (and, with `atLeastOneSecond`, a
// second passed since the last report), or after 5 seconds. False cancels the run.
bool CVXSelEngine::ReportProgress_(unsigned percent, bool atLeastOneSecond) {
  const int64_t now = NowMs();
  const bool changed =
      percent != lastPercent_ && (!atLeastOneSecond || now - lastReportMs_ >= 1000);
  if (!changed && now - lastReportMs_ < 5000) return true;
  lastPercent_ = percent;
  lastReportMs_ = now;
  return Cancel_(Feedback(Progress, percent));
}

bool CVXSelEngine::Cancel_(bool go) {
  if (go) return true;
  aborted_ = true;
  Feedback(Cancelled, 0);
  return false;
}

void CVXSelEngine::MakeEntries_(CVXResultSet& result) {
  auto& entries = result.Properties().Entries;
  if (!selector_.Properties().NeedsOriginals) {
    entries.emplace_back();
    entries.back().Number = 1;
    return;
  }
  Feedback(Progress, 0);
  lastPercent_ = 0;
  lastReportMs_ = NowMs();
  for (size_t i = 0; i < originals_.size(); ++i) {
    const SVXFileDescriptor& d = originals_[i];
    SVXResultSetEntry& entry = entries.emplace_back();
    entry.OID = d.OID;
    entry.Folder = d.Folder;
    entry.URI = d.URI;
    entry.Number = static_cast<uint32_t>(i + 1);
    SVXDBRec_3 shape{};
    const bool wantShape = d.OID == 0 && limits_.ExactDuplicates == 0;
    unsigned rc = CreateVXFile(d, entry.File, wantShape ? &shape : nullptr);
    if (wantShape) originalShapes_.push_back(shape);
    if (rc != VX_OK) VX_THROW(rc);
    const unsigned percent = Percent(i + 1, originals_.size());
    const int64_t now = NowMs();
    if (percent != lastPercent_ || now - lastReportMs_ >= 5000) {
      lastPercent_ = percent;
      lastReportMs_ = now;
      if (!Cancel_(Feedback(Progress, percent > 10 ? percent - 10 : 0))) return;
    }
  }
}

// Keeps only candidates whose CRC some original shares.
void CVXSelEngine::SelectExactDuplicates_(CVXResultSet& result, CBitVector& candidates) {
  Feedback(Progress, 0);
  std::vector<uint32_t> crcs;
  for (uint32_t oid : candidates) {
    CVXCatFile file;
    if (engine_->GetFile(oid, file) == VX_OK) crcs.push_back(file.Properties().CRC);
  }
  std::sort(crcs.begin(), crcs.end());
  const auto& entries = result.Properties().Entries;
  CBitVector keep;
  unsigned reported = 0;
  for (size_t i = 0; i < entries.size(); ++i) {
    const CVXCatFile::SData& file = entries[i].File.Properties();
    if (std::binary_search(crcs.begin(), crcs.end(), file.CRC)) {
      CBitVector bits;
      engine_->Catalog().GetFilesForCRC(file.CRC, file.Size, bits);
      keep |= bits;
    }
    if (i < 100 || (i + 1) % 100 == 0) {
      const unsigned percent = Percent(i + 1, entries.size());
      if (percent >= reported + 5) {
        reported = percent;
        if (!Cancel_(Feedback(Progress, percent))) return;
      }
    }
  }
  candidates &= keep;
}

void CVXSelEngine::MakeCandidates_(const CBitVector& candidates, bool needsShape) {
  candidates_.clear();
  if (needsShape && !limits_.ExactDuplicates) {
    if (unsigned rc = engine_->OptimizeShapeDataAccess(candidates, candidates_); rc != VX_OK) {
      VX_THROW(rc);
    }
  } else {
    candidates.Convert(candidates_);
  }
  candidatePos_ = 0;
}

unsigned CVXSelEngine::LoadOrgShapes(CVXResultSet& result) {
  const auto& entries = result.Properties().Entries;
  for (const SVXResultSetEntry& entry : entries) {
    if (entry.File.Oid() == 0) continue;
    SVXDBRec_3 record;
    unsigned rc = engine_->GetShapeData(entry.File.Oid(), record);
    if (rc != VX_OK) {
      VX_ERROR(engine_->LogFile(), rc, "LoadOrgShapes");
      break;
    }
    originalShapes_.push_back(record);
  }
  if (originalShapes_.size() != entries.size()) {
    VX_ERROR(engine_->LogFile(), VX_UNKNOWN_EXCEPTION, "OrgShapes not matching result size!");
    result_ = VX_UNKNOWN_EXCEPTION;
  }
  return result_;
}

// ---- The candidate loop

void CVXSelEngine::MainLoop_(CVXResultSet& result, bool needsShape) {
  if (needsShape && !StartPrefetch(engine_, shapeBuffer_.get(), &candidates_, 0)) {
    VX_ERROR(engine_->LogFile(), VX_UNKNOWN_EXCEPTION, "Prefetch");
  }
  const auto& entries = result.Properties().Entries;
  entryCutOffs_.assign(entries.size(), 0.0);
  // The candidate's location only tells it from an external original, which has no OID.
  const bool needsUri = std::any_of(entries.begin(), entries.end(),
                                    [](const SVXResultSetEntry& e) { return e.OID == 0; });
  fileWindow_.clear();
  StartBlockScoring_(result, needsShape);
  lastPercent_ = 0;
  lastReportMs_ = NowMs();
  for (candidatePos_ = 0; candidatePos_ < candidates_.size() && !aborted_; ++candidatePos_) {
    currentOid_ = candidates_[candidatePos_];
    CVXURI uri;
    if (needsUri) engine_->GetFileURI(currentOid_, uri);
    if (unsigned rc = ReadCurrentFile_(); rc != VX_OK) {
      result_ = rc;
      VX_ERROR(engine_->LogFile(), rc, "Selection: reading a candidate");
      return;
    }
    currentHistValid_ = false;
    if (selector_.Properties().NeedsOriginals) {
      ScoreWithOriginals_(result, uri, needsShape);
    } else {
      ScoreWithoutOriginals_(result);
    }
    if (candidatePos_ == 0) {
      if (!Cancel_(Feedback(Progress, 0))) return;
      lastReportMs_ = NowMs();
    } else if (!ReportProgress_(Percent(candidatePos_ + 1, candidates_.size()), true)) {
      return;
    }
  }
}

// The records are read a bank's worth at a time, at the turn of the bank, where the loop waits
// for the read-ahead thread anyway: taking the engine's lock for every candidate made the loop
// and that thread trade the lock at every step. A change through the engine (a client may make
// one from Feedback) has the window read again, so each candidate's record is what GetFile
// would give at its turn. A file the window lacks is asked for through GetFile, which answers
// and logs as it does for a lone read.
unsigned CVXSelEngine::ReadCurrentFile_() {
  size_t k = candidatePos_ - windowFirst_;
  if (candidatePos_ < windowFirst_ || k >= fileWindow_.size() ||
      engine_->Changes() != windowChanges_) {
    windowFirst_ = candidatePos_;
    windowChanges_ = engine_->Changes();
    const size_t count = std::min(kFileWindow, candidates_.size() - candidatePos_);
    fileCodes_.assign(count, VX_NOT_FOUND);
    engine_->GetFiles(candidates_.data() + candidatePos_, count, fileWindow_, fileCodes_);
    k = 0;
  }
  if (fileCodes_[k] != VX_OK) return engine_->GetFile(currentOid_, currentFile_);
  currentFile_ = fileWindow_[k];  // a copy: the window keeps its strings for the next read
  return VX_OK;
}

// Sums the workers' scores; false when one of them rejects the candidate.
bool CVXSelEngine::SumWorkers_(double minScore, double& sum) {
  sum = 0;
  for (auto& worker : workers_) {
    double score = 0;
    if (!worker->Check(score, minScore)) return false;
    sum += score;
  }
  return true;
}

void CVXSelEngine::ScoreWithoutOriginals_(CVXResultSet& result) {
  SVXResultSetEntry& entry = result.Properties().Entries.front();
  currentEntry_ = &entry;
  double sum = 0;
  if (!SumWorkers_(0, sum)) return;
  const double w = static_cast<double>(workers_.size());
  if (sum / w <= sum) {
    entry.Hits.push_back({currentOid_, currentFile_.Properties().Folder, sum / w});
  }
  // The cut-off this gives is not kept: without originals the workers never see one.
  if (interval_ != 0 && entry.Hits.size() > limits_.MaxResults + interval_) {
    cutOffInForce_ = true;
    ResultCutOff(entry);
  }
}

bool CVXSelEngine::IsCandidate_(const SVXResultSetEntry& entry, const CVXURI& uri) const {
  return entry.OID != 0 ? entry.OID == currentOid_ : SameLocation(entry.URI, uri);
}

bool CVXSelEngine::EnterEntry_(std::vector<SVXResultSetEntry>& entries, size_t i, const CVXURI& uri,
                               bool needsShape) {
  SVXResultSetEntry& entry = entries[i];
  currentOriginal_ = &entry.File;
  currentEntry_ = &entry;
  if (needsShape) originalShape_ = i < originalShapes_.size() ? &originalShapes_[i] : &emptyShape_;
  return !IsCandidate_(entry, uri);
}

void CVXSelEngine::ScoreWithOriginals_(CVXResultSet& result, const CVXURI& uri, bool needsShape) {
  if (scorer_) return ScoreFromBlock_(result, uri);
  auto& entries = result.Properties().Entries;
  for (size_t i = 0; i < entries.size() && !aborted_; ++i) {
    if (!EnterEntry_(entries, i, uri, needsShape)) continue;
    double sum = 0;
    if (limits_.ExactDuplicates) {
      if (entries[i].File.Properties().CRC != currentFile_.Properties().CRC) continue;
      sum = 100;
    } else if (!SumWorkers_(MinScoreOf_(i), sum)) {
      continue;
    }
    AddHit_(entries[i], i, sum);
  }
}

void CVXSelEngine::AddHit_(SVXResultSetEntry& entry, size_t i, double sum) {
  const double w = static_cast<double>(workers_.size());
  const bool greyDiffers =
      ((entry.File.Properties().Flags ^ currentFile_.Properties().Flags) & cfGreyscale) != 0;
  if (fileFormat_.Active && fileFormat_.GrayScaleMode == 1 && greyDiffers) sum *= 0.75;
  double& c = entryCutOffs_[i];
  c = c >= 1e-6 ? std::min(c, sum / w) : sum / w;
  if (c <= sum) {
    entry.Hits.push_back({currentOid_, currentFile_.Properties().Folder, sum / w});
    if (interval_ != 0 && entry.Hits.size() > limits_.MaxResults + interval_) {
      cutOffInForce_ = true;
      c = ResultCutOff(entry);
    }
  }
  // A cut-off below the floor its block was scored with: pairs the block left out may count.
  if (i < blockFloors_.size() && c < blockFloors_[i]) floorsBroken_ = true;
}

// ---- Scoring by blocks
//
// With one worker that scores by shape records alone, the scores of a candidate against every
// original do not depend on the running cut-offs: the cut-off only decides whether Check
// reports the score. So the scores of a block of candidates are made at once, on several
// threads, and the candidates then pass through the entries one by one as in
// ScoreWithOriginals_, each entry taking its score from the block. The candidate's record is
// still asked for where the plain walk asks for it, so the read-ahead runs alike.

void CVXSelEngine::StartBlockScoring_(CVXResultSet& result, bool needsShape) {
  scorer_.reset();
  blockFloors_.clear();
  floorsBroken_ = false;
  const auto& entries = result.Properties().Entries;
  if (scoringThreads_ < 2 || !needsShape || !selector_.Properties().NeedsOriginals ||
      limits_.ExactDuplicates || workers_.size() != 1 || entries.size() < kBlockScoringOriginals ||
      !workers_[0]->ScoresByShapesAlone()) {
    return;
  }
  std::vector<const SVXDBRec_3*> originals;
  for (size_t i = 0; i < entries.size(); ++i) {
    originals.push_back(i < originalShapes_.size() ? &originalShapes_[i] : &emptyShape_);
  }
  scorer_ = std::make_unique<CVXSelBlockScorer>(*workers_[0], originals, scoringThreads_);
  blockFirst_ = 0;
}

void CVXSelEngine::ScoreBlock_(const SVXDBRec_3* shape) {
  std::vector<const SVXDBRec_3*> block = {shape};
  for (size_t pos = candidatePos_ + 1; pos < candidates_.size() && block.size() < kBlockCandidates;
       ++pos) {
    auto it = shapeCache_.find(candidates_[pos]);
    if (it == shapeCache_.end()) break;
    block.push_back(it->second);
  }
  // Once in force, a running cut-off only rises as a rule: Check passes no sum below it, and
  // ResultCutOff keeps the best of hits that all reached it. So today's cut-offs serve as floors
  // for the whole block. What can lower one (a ResultCutOff of the client's, the grey-scale
  // penalty) is caught in AddHit_, and the run goes on without floors.
  blockFloors_.clear();
  if (cutOffInForce_ && !floorsBroken_) blockFloors_ = entryCutOffs_;
  scorer_->ScoreBlock(block, blockFloors_);
  blockFirst_ = candidatePos_;
}

void CVXSelEngine::ScoreFromBlock_(CVXResultSet& result, const CVXURI& uri) {
  auto& entries = result.Properties().Entries;
  const size_t n = entries.size();
  size_t first = 0;
  while (first < n && IsCandidate_(entries[first], uri)) ++first;
  if (first < n) {
    // Where Check would first have asked for the candidate's record.
    const SVXDBRec_3* shape = GetCurrentShapeInfo();
    size_t b = candidatePos_ - blockFirst_;
    if (candidatePos_ < blockFirst_ || b >= scorer_->Candidates() ||
        scorer_->Candidate(b) != shape || (floorsBroken_ && !blockFloors_.empty())) {
      ScoreBlock_(shape);
      b = 0;
    }
    scorer_->ForEachPass(b, [&](const CVXSelBlockScorer::SPass& pass) {
      const size_t i = pass.Original;
      if (i < first || !(pass.Score >= MinScoreOf_(i)) || !EnterEntry_(entries, i, uri, true)) {
        return;
      }
      AddHit_(entries[i], i, pass.Score);
    });
  }
  // The walk over the entries ends at the last one.
  EnterEntry_(entries, n - 1, uri, true);
}

// ---- Results

double CVXSelEngine::ResultCutOff(SVXResultSetEntry& entry) {
  auto& hits = entry.Hits;
  double m = 0;
  for (const SVXRSEntry& hit : hits) m = std::max(m, hit.Score);
  if (m > 100) {
    for (SVXRSEntry& hit : hits) hit.Score = hit.Score / m * 100;
  }
  std::stable_sort(hits.begin(), hits.end(),
                   [](const SVXRSEntry& a, const SVXRSEntry& b) { return a.Score > b.Score; });
  const double minScore = limits_.MinScore;
  if (limits_.Mode == 1 && !hits.empty() && hits.back().Score < minScore) {
    hits.erase(std::find_if(hits.begin(), hits.end(),
                            [&](const SVXRSEntry& h) { return h.Score < minScore; }),
               hits.end());
  }
  if (hits.size() > limits_.MaxResults) hits.resize(limits_.MaxResults);
  double v = hits.empty() ? 0 : hits.back().Score;
  if (m > 100) v = v * 100 / m;
  return limits_.Mode == 1 ? std::max(v, minScore) : v;
}

unsigned CVXSelEngine::PrepareResult(SVXResultSetEntry& entry) {
  if (entry.OID != 0) engine_->GetFileURI(entry.OID, entry.URI);
  if (!entry.Hits.empty()) ResultCutOff(entry);
  return VX_OK;
}

void CVXSelEngine::PrepareResults_(CVXResultSet& result) {
  auto& entries = result.Properties().Entries;
  Feedback(ResultPrepare, entries.size());
  Feedback(Progress, 0);
  VX_LOGF(engine_->LogFile(), 3, "Sorting and preparing %lu result sets",
          static_cast<unsigned long>(entries.size()));
  lastPercent_ = 0;
  lastReportMs_ = NowMs();
  for (size_t i = 0; i < entries.size(); ++i) {
    PrepareResult(entries[i]);
    const unsigned percent = static_cast<unsigned>(std::min<size_t>(i * 80 / entries.size(), 80));
    if (!ReportProgress_(percent, false)) break;
  }
  Feedback(Progress, 80);
  if (!aborted_) {
    if (limits_.Active && limits_.DropEmpty) {
      std::erase_if(entries, [](const SVXResultSetEntry& e) { return e.Hits.empty(); });
    }
    Feedback(Progress, 95);
    for (size_t i = 0; i < entries.size(); ++i) entries[i].Number = static_cast<uint32_t>(i + 1);
  }
  Feedback(Progress, 100);
  Feedback(ResultReady, 0);
}

void CVXSelEngine::Finish_(CVXResultSet& result) {
  if (result_ != VX_OK) result.Clear();
  Feedback(Progress, 100);
  if (result_ != VX_OK) {
    Feedback(Failed, 0);
  } else if (aborted_) {
    Feedback(Cancelled, 0);
  }
  Feedback(Finished, 0);
  // Match plug-ins hear that the run is over; none are loaded by this build.
}

// ---- Shape records and histograms

const SVXDBRec_3* CVXSelEngine::GetCurrentShapeInfo() {
  // Every original asks for the same candidate's record in turn.
  if (currentShape_ && currentShapeOid_ == currentOid_) return currentShape_;
  currentShape_ = FindCurrentShape_();
  currentShapeOid_ = currentOid_;
  return currentShape_;
}

const SVXDBRec_3* CVXSelEngine::FindCurrentShape_() {
  if (auto it = shapeCache_.find(currentOid_); it != shapeCache_.end()) return it->second;
  SPrefetchBlock& p = Prefetch();
  for (;;) {
    shapeCache_.clear();
    WaitPrefetch();
    result_ = p.Result;
    if (result_ != VX_OK) {
      VX_ERROR(engine_->LogFile(), result_, "Reading shape records");
      break;
    }
    const uint8_t* bank = shapeBuffer_.get() + p.Bank * kPrefetchBankBytes;
    for (size_t i = 0; i < p.Selectors.size(); ++i) {
      shapeCache_[p.Selectors[i].Oid] =
          reinterpret_cast<const SVXDBRec_3*>(bank + i * kShapeRecordBytes);
    }
    if (shapeCache_.count(currentOid_)) {
      StartPrefetch(engine_, shapeBuffer_.get(), &candidates_, p.Position);
      break;
    }
    // The loop moved on without this bank (or it was empty): read from the current candidate.
    if (!StartPrefetch(engine_, shapeBuffer_.get(), &candidates_, candidatePos_)) break;
  }
  if (auto it = shapeCache_.find(currentOid_); it != shapeCache_.end()) return it->second;
  result_ = VX_NOT_FOUND;
  VX_ERROR(engine_->LogFile(), result_, "Shape record missing");
  return &emptyShape_;
}

const CHist& CVXSelEngine::GetOriginalHist(double& weight) {
  const uint32_t number = currentEntry_ ? currentEntry_->Number : 0;
  auto it = originalHists_.find(number);
  if (it == originalHists_.end()) {
    CHist hist;
    hist.Build(originalShape_ ? originalShape_->Info : emptyShape_.Info, match_.Weighting);
    double sum = 0;
    for (float bin : hist.Bins) sum += bin;
    it = originalHists_.emplace(number, std::make_pair(hist, std::trunc(sum))).first;
  }
  weight = it->second.second;
  return it->second.first;
}

const CHist& CVXSelEngine::GetCurrentHist() {
  if (!currentHistValid_) {
    currentHist_.Build(GetCurrentShapeInfo()->Info, match_.Weighting);
    currentHistValid_ = true;
  }
  return currentHist_;
}
