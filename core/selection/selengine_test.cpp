#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <functional>
#include <map>
#include <optional>
#include <random>
#include <tuple>
#include <utility>
#include <vector>

#include "MatchKernels.h"
#include "VXSelBase.h"
#include "VXSelEngine.h"
#include "VXSelector.h"
#include "vxengine_fixture.h"

namespace {

using State = CVXSelEngine::EState;
using Events = std::vector<std::pair<State, unsigned long>>;

// Records the feedback of a run and answers false when `refuse` says so of the events so far,
// the one being answered included.
class RecordingSelEngine : public CVXSelEngine {
 public:
  using CVXSelEngine::CVXSelEngine;
  using CVXSelEngine::SetScoringThreads;
  using CVXSelEngine::Workers;

  bool Feedback(EState state, unsigned long value) const override {
    events.emplace_back(state, value);
    return !(refuse && refuse(events));
  }

  // External originals: OID 0 is answered with `external` and its shape, or with `failure`.
  unsigned CreateVXFile(const SVXFileDescriptor& descriptor, CVXCatFile& file,
                        SVXDBRec_3* shape) override {
    if (descriptor.OID != 0 || !external) {
      return CVXSelEngine::CreateVXFile(descriptor, file, shape);
    }
    if (failure != VX_OK) return failure;
    file = *external;
    if (shape) *shape = externalShape;
    return VX_OK;
  }

  // With keepAll the hits stay as they are and the cut-off is by turns the highest and the
  // lowest score kept, so that the running cut-off jumps up and down.
  double ResultCutOff(SVXResultSetEntry& entry) override {
    if (!keepAll) return CVXSelEngine::ResultCutOff(entry);
    const auto [low, high] = std::minmax_element(
        entry.Hits.begin(), entry.Hits.end(),
        [](const SVXRSEntry& a, const SVXRSEntry& b) { return a.Score < b.Score; });
    return (highNext = !highNext) ? high->Score : low->Score;
  }

  mutable Events events;
  std::function<bool(const Events&)> refuse;
  bool keepAll = false;
  bool highNext = false;
  const CVXCatFile* external = nullptr;
  SVXDBRec_3 externalShape{};
  unsigned failure = VX_OK;
};

// Refuses the n-th report of `state` that follows a report of `after` (or the start).
std::function<bool(const Events&)> Refuse(State state, int n, std::optional<State> after = {}) {
  return [=](const Events& events) {
    bool armed = !after;
    int seen = 0;
    for (const auto& event : events) {
      if (after && event.first == *after) armed = true;
      if (armed && event.first == state) ++seen;
    }
    return seen == n && events.back().first == state;
  };
}

SVXDBRec_3 RandomShape(std::mt19937& rng) {
  SVXDBRec_3 shape{};
  for (auto& cell : shape.Info.Cells) {
    uint32_t v = rng();
    cell = {static_cast<uint8_t>(v), static_cast<uint8_t>(v >> 8), static_cast<uint8_t>(v >> 16),
            static_cast<uint8_t>((v >> 24) % 101)};
  }
  return shape;
}

CVXMemFile Blob(SSelCoreData& record) {
  CVXMemFile blob;
  record.Store(&blob, true);
  return blob;
}

// Quick colour-and-shape matching, with the limits given; `tweak` may change both features.
CVXSelector MatchSelector(uint32_t maxResults, uint32_t minScore,
                          const std::function<void(SSelMatch&, SSelLimits&)>& tweak = {}) {
  CVXSelector selector;
  SSelMatch match;
  match.Reset();
  match.Active = true;
  match.NeedsOriginals = true;
  SSelLimits limits;
  limits.Reset();
  limits.Active = true;
  limits.MaxResults = maxResults;
  limits.MinScore = minScore;
  if (tweak) tweak(match, limits);
  selector.SetFeature(SSelMatch::kKey, Blob(match));
  selector.SetFeature(SSelLimits::kKey, Blob(limits));
  selector.Properties().NeedsOriginals = true;
  return selector;
}

class SelEngineTest : public vxtest::EngineFixture {
 protected:
  // `count` files with random shape records but for those in `special`, by index; their OIDs and
  // records are kept.
  void AddFiles(size_t count, uint32_t seed, const std::map<size_t, SVXDBRec_3>& special = {}) {
    std::mt19937 rng(seed);
    uint32_t folder = AddFolder("/photos/");
    for (size_t i = 0; i < count; ++i) {
      CVXCatFile file(0, "f" + std::to_string(i) + ".jpg", folder);
      file.Properties().CRC = static_cast<uint32_t>(i % 3);  // a few exact duplicates
      CVXThumb thumb = vxtest::MakeThumb(4, 4, 16, 1);
      SVXDBRec_3 shape = RandomShape(rng);
      if (auto it = special.find(i); it != special.end()) shape = it->second;
      ASSERT_EQ(engine_.AddFile(file, thumb, shape), VX_OK);
      oids_.push_back(file.Oid());
      shapes_.push_back(shape);
    }
  }

  std::vector<SVXFileDescriptor> Originals(size_t count) {
    std::vector<SVXFileDescriptor> originals;
    for (size_t i = 0; i < count; ++i) originals.push_back({oids_[i * 7 + 3], 0, CVXURI()});
    return originals;
  }

  std::vector<uint32_t> oids_;
  std::vector<SVXDBRec_3> shapes_;
};

TEST_F(SelEngineTest, WithoutOriginalsEveryFileIsOneEntrysHitWithThemTheyAreRequired) {
  AddFiles(30, 3);
  RecordingSelEngine run(&engine_);
  CVXSelector selector;  // no feature: every candidate scores 100
  ASSERT_EQ(run.InitSelection(selector, Originals(2)), VX_OK);
  EXPECT_TRUE(run.GetOriginalImages().empty());
  CVXResultSet result;
  ASSERT_EQ(run.Run(result), VX_OK);
  ASSERT_EQ(result.Properties().Entries.size(), 1u);
  const SVXResultSetEntry& entry = result.Properties().Entries[0];
  EXPECT_EQ(entry.Number, 1u);
  EXPECT_EQ(entry.OID, 0u);
  ASSERT_EQ(entry.Hits.size(), 30u);
  for (const SVXRSEntry& hit : entry.Hits) EXPECT_EQ(hit.Score, 100);
  const Events expected = {
      {State::Started, 0},       {State::PreselectBegin, 30}, {State::Progress, 100},
      {State::PreselectEnd, 30}, {State::Progress, 0},        {State::ResultPrepare, 1},
      {State::Progress, 0},      {State::Progress, 80},       {State::Progress, 95},
      {State::Progress, 100},    {State::ResultReady, 0},     {State::Progress, 100},
      {State::Finished, 0}};
  EXPECT_EQ(run.events, expected);

  // A selector that needs originals refuses a run without them, before any feedback.
  RecordingSelEngine needy(&engine_);
  ASSERT_EQ(needy.InitSelection(MatchSelector(10, 0), {}), VX_OK);
  EXPECT_EQ(needy.Run(result), VX_NEUTRAL_FAILURE);
  EXPECT_TRUE(needy.events.empty());
}

// Cancelling ends every stage with Cancelled, then the clean-up's Progress 100, Cancelled and
// Finished. A stage of the preselection closes it first; a cancelled main loop keeps its hits
// unprepared; a cancelled preparation still reports the result ready.
TEST_F(SelEngineTest, CancellingAtEachStageEndsWithTheClosingSequence) {
  AddFiles(20, 5);
  const Events tail = {{State::Progress, 100}, {State::Cancelled, 0}, {State::Finished, 0}};
  const Events closePreselection = {
      {State::Cancelled, 0}, {State::Progress, 100}, {State::PreselectEnd, 40}};
  struct Case {
    const char* stage;
    std::function<bool(const Events&)> refuse;
    bool exactDuplicates;
    Events before;  // what follows the refused report, up to the common tail
    size_t entries;
    bool keepsHits;
  };
  const Case cases[] = {
      // The first report of the walk over the originals; the one before starts the walk.
      {"originals", Refuse(State::Progress, 2), false, closePreselection, 1, false},
      // After the walk's three reports, the stage's own Progress 0 and then its first percent.
      {"exact duplicates", Refuse(State::Progress, 5), true, closePreselection, 2, false},
      // The report after the first candidate.
      {"main loop",
       Refuse(State::Progress, 1, State::PreselectEnd),
       false,
       {{State::Cancelled, 0}},
       2,
       true},
      {"preparation",
       Refuse(State::Progress, 2, State::ResultPrepare),
       false,
       {{State::Cancelled, 0},
        {State::Progress, 80},
        {State::Progress, 100},
        {State::ResultReady, 0}},
       2,
       true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.stage);
    RecordingSelEngine run(&engine_);
    run.refuse = c.refuse;
    CVXSelector selector = MatchSelector(
        10, 0, [&](SSelMatch&, SSelLimits& limits) { limits.ExactDuplicates = c.exactDuplicates; });
    ASSERT_EQ(run.InitSelection(selector, Originals(2)), VX_OK);
    CVXResultSet result;
    EXPECT_EQ(run.Run(result), VX_OK);
    EXPECT_TRUE(run.Aborted());
    Events expected = c.before;
    expected.insert(expected.end(), tail.begin(), tail.end());
    ASSERT_GE(run.events.size(), expected.size() + 1);
    Events last(run.events.end() - static_cast<long>(expected.size()), run.events.end());
    EXPECT_EQ(last, expected);
    EXPECT_EQ(
        std::count(run.events.begin(), run.events.end(), std::make_pair(State::Cancelled, 0ul)), 2);
    ASSERT_EQ(result.Properties().Entries.size(), c.entries);
    EXPECT_EQ(!result.Properties().Entries[0].Hits.empty(), c.keepsHits);
  }
}

// The whole protocol of a run over originals that is not cancelled, with the percents of the
// walk over the originals lowered by 10.
TEST_F(SelEngineTest, FeedbackOfACompleteRunWithOriginals) {
  AddFiles(20, 5);
  RecordingSelEngine run(&engine_);
  ASSERT_EQ(run.InitSelection(MatchSelector(10, 0), Originals(2)), VX_OK);
  CVXResultSet result;
  ASSERT_EQ(run.Run(result), VX_OK);
  const Events expected = {
      {State::Started, 2},       {State::PreselectBegin, 40}, {State::Progress, 0},
      {State::Progress, 40},     {State::Progress, 90},       {State::Progress, 100},
      {State::PreselectEnd, 40}, {State::Progress, 0},        {State::ResultPrepare, 2},
      {State::Progress, 0},      {State::Progress, 40},       {State::Progress, 80},
      {State::Progress, 95},     {State::Progress, 100},      {State::ResultReady, 0},
      {State::Progress, 100},    {State::Finished, 0}};
  EXPECT_EQ(run.events, expected);
}

// An original the catalog does not hold comes from the client with its shape record. A catalog
// file at the same location, whatever the case, is the original itself and no hit of it.
TEST_F(SelEngineTest, ExternalOriginalsComeFromTheClient) {
  AddFiles(30, 9);
  CVXURI location;
  ASSERT_EQ(engine_.GetFileURI(oids_[5], location), VX_OK);
  std::string upper = location.AsString();
  for (char& ch : upper) ch = static_cast<char>(std::toupper(static_cast<unsigned char>(ch)));

  CVXCatFile external(0, "outside.jpg", 0);
  for (const bool sameLocation : {false, true}) {
    SCOPED_TRACE(sameLocation);
    RecordingSelEngine run(&engine_);
    run.external = &external;
    run.externalShape = shapes_[5];
    const CVXURI uri =
        sameLocation ? CVXURI(upper, false) : CVXURI("file:///elsewhere/a.jpg", false);
    ASSERT_EQ(run.InitSelection(MatchSelector(3, 0), {{0, 0, uri}}), VX_OK);
    EXPECT_TRUE(run.IsExternalMatch());
    CVXResultSet result;
    ASSERT_EQ(run.Run(result), VX_OK);
    ASSERT_EQ(result.Properties().Entries.size(), 1u);
    const SVXResultSetEntry& entry = result.Properties().Entries[0];
    EXPECT_EQ(entry.OID, 0u);
    EXPECT_EQ(entry.File.Name(), "outside.jpg");
    ASSERT_EQ(entry.Hits.size(), 3u);
    // Limits and match average to 100 only for the identical record.
    EXPECT_EQ(entry.Hits[0].OID == oids_[5], !sameLocation);
    EXPECT_EQ(entry.Hits[0].Score == 100, !sameLocation);
  }
}

// Bad input ends the run with a code and an empty result, never with a crash: an original
// that the client cannot deliver, one without OID that no client override supplies, a
// candidate that the client removes while the run walks the candidates, a candidate whose shape
// record is missing, a feature blob cut short.
TEST_F(SelEngineTest, BadInputGivesItsCode) {
  AddFiles(30, 4);
  const Events failedTail = {{State::Progress, 100}, {State::Failed, 0}, {State::Finished, 0}};
  CVXCatFile external(0, "outside.jpg", 0);
  auto expectFailure = [&](RecordingSelEngine& run, const std::vector<SVXFileDescriptor>& originals,
                           unsigned code) {
    ASSERT_EQ(run.InitSelection(MatchSelector(5, 0), originals), VX_OK);
    CVXResultSet result;
    EXPECT_EQ(run.Run(result), code);
    EXPECT_TRUE(result.IsEmpty());
    ASSERT_GE(run.events.size(), failedTail.size());
    EXPECT_EQ(Events(run.events.end() - 3, run.events.end()), failedTail);
  };
  {
    SCOPED_TRACE("client cannot load the original");
    RecordingSelEngine run(&engine_);
    run.external = &external;
    run.failure = VX_NOT_FOUND;
    expectFailure(run, {{0, 0, CVXURI("file:///x/y.jpg", false)}}, VX_NOT_FOUND);
  }
  {
    SCOPED_TRACE("no client for files outside the catalog");
    RecordingSelEngine run(&engine_);
    expectFailure(run, {{0, 0, CVXURI("file:///x/y.jpg", false)}}, VX_NO_FILE_OID);
  }
  {
    SCOPED_TRACE("a candidate removed during the run");
    RecordingSelEngine run(&engine_);
    // After the first candidate, whose turn read the records of all 30 ahead.
    run.refuse = [&](const Events& events) {
      if (events.back() == std::make_pair(State::Progress, 0ul) &&
          std::count(events.begin(), events.end(), std::make_pair(State::PreselectEnd, 30ul)) &&
          engine_.GetFile(oids_[25], *std::make_unique<CVXCatFile>()) == VX_OK) {
        EXPECT_EQ(engine_.RemoveFile(oids_[25]), VX_OK);
      }
      return false;
    };
    expectFailure(run, Originals(1), VX_NOT_FOUND);
  }
  {
    SCOPED_TRACE("a candidate without shape record");
    ASSERT_EQ(engine_.MatchStore().Remove(CQRLBlobDB::SSelector(2, oids_[20])), VX_OK);
    RecordingSelEngine run(&engine_);
    expectFailure(run, Originals(1), VX_NOT_FOUND);
  }
  {
    SCOPED_TRACE("a feature cut short");
    CVXSelector selector = MatchSelector(5, 0);
    CVXMemFile blob;
    ASSERT_TRUE(selector.GetFeature(SSelMatch::kKey, blob));
    CVXMemFile cut(blob.GetBuffer(), blob.GetFileSize() - 3);
    selector.SetFeature(SSelMatch::kKey, cut);
    RecordingSelEngine run(&engine_);
    EXPECT_EQ(run.InitSelection(selector, Originals(1)), VX_NOT_FOUND);
  }
}

// A pattern that the expression engine refuses matches nothing; an empty catalog gives an
// empty entry. Both are runs that succeed.
TEST_F(SelEngineTest, RefusedPatternAndEmptyCatalogFindNothing) {
  auto namePattern = [](const std::string& pattern) {
    CVXSelector selector;
    SSelFileName name;
    name.Reset();
    name.Active = true;
    name.Mode = 2;
    name.Pattern = pattern;
    selector.SetFeature(SSelFileName::kKey, Blob(name));
    return selector;
  };
  auto hits = [&](const CVXSelector& selector) {
    RecordingSelEngine run(&engine_);
    EXPECT_EQ(run.InitSelection(selector, {}), VX_OK);
    CVXResultSet result;
    EXPECT_EQ(run.Run(result), VX_OK);
    EXPECT_EQ(result.Properties().Entries.size(), 1u);
    return result.Properties().Entries.empty() ? 0 : result.Properties().Entries[0].Hits.size();
  };
  EXPECT_EQ(hits(namePattern("f1")), 0u);
  AddFiles(30, 2);
  EXPECT_EQ(hits(namePattern("^f1")), 11u);  // f1 and f10 to f19
  EXPECT_EQ(hits(namePattern("f1(")), 0u);
}

// The cut-off rescales scores above 100 so that the best is 100, keeps MaxResults hits of at
// least MinScore and reports the lowest kept on the original scale, at least MinScore.
TEST_F(SelEngineTest, ResultCutOffRescalesFiltersAndTruncates) {
  AddFiles(4, 1);
  for (const uint32_t mode : {0u, 1u}) {
    RecordingSelEngine run(&engine_);
    const CVXSelector selector =
        MatchSelector(2, 50, [&](SSelMatch&, SSelLimits& limits) { limits.Mode = mode; });
    ASSERT_EQ(run.InitSelection(selector, Originals(1)), VX_OK);
    SVXResultSetEntry entry;
    entry.Hits = {{1, 0, 90}, {2, 0, 200}, {3, 0, 40}, {4, 0, 150}};
    EXPECT_EQ(run.ResultCutOff(entry), mode == 1 ? 50 : 37.5);
    ASSERT_EQ(entry.Hits.size(), 2u);
    EXPECT_EQ(entry.Hits[0].OID, 2u);
    EXPECT_EQ(entry.Hits[0].Score, 100);
    EXPECT_EQ(entry.Hits[1].OID, 4u);
    EXPECT_EQ(entry.Hits[1].Score, 75);
  }
}

// Exact duplicates are the other files with the original's CRC. An original without any, here
// one from outside the catalog, is dropped, and the entries are numbered anew.
TEST_F(SelEngineTest, ExactDuplicatesAndDroppedEmptyEntries) {
  AddFiles(9, 6);  // CRCs 0, 1, 2, 0, 1, 2, ...
  CVXCatFile external(0, "outside.jpg", 0);
  external.Properties().CRC = 55;
  RecordingSelEngine run(&engine_);
  run.external = &external;
  const CVXSelector selector = MatchSelector(10, 0, [](SSelMatch&, SSelLimits& limits) {
    limits.ExactDuplicates = 1;
    limits.DropEmpty = 1;
  });
  ASSERT_EQ(run.InitSelection(selector, {{0, 0, CVXURI("file:///x/outside.jpg", false)},
                                         {oids_[7], 0, CVXURI()}}),
            VX_OK);
  CVXResultSet result;
  ASSERT_EQ(run.Run(result), VX_OK);
  ASSERT_EQ(result.Properties().Entries.size(), 1u);
  const SVXResultSetEntry& entry = result.Properties().Entries[0];
  EXPECT_EQ(entry.OID, oids_[7]);
  EXPECT_EQ(entry.Number, 1u);
  std::vector<uint32_t> found;
  for (const auto& hit : entry.Hits) found.push_back(hit.OID);
  std::sort(found.begin(), found.end());
  EXPECT_EQ(found, (std::vector<uint32_t>{oids_[1], oids_[4]}));
}

SVXDBRec_3 Uniform(uint8_t value) {
  SVXDBRec_3 shape{};
  for (auto& cell : shape.Info.Cells) cell = {value, value, value, value};
  return shape;
}

// What a run gives, for comparing two runs.
struct Outcome {
  unsigned code;
  std::vector<std::tuple<uint32_t, uint32_t, std::vector<std::pair<uint32_t, double>>>> entries;
  Events reports;  // all but the progress percents, which depend on time
  bool operator==(const Outcome&) const = default;
};

// Runs over more candidates than the two banks hold. The run reads shape records on a second
// thread and prunes hit lists with a running cut-off; its result must be that of scoring every
// candidate in one plain pass. Scoring by blocks of candidates on several threads must give
// exactly what the caller's thread alone gives: the same hits, scores and reports, for every
// kind of comparison that scores by shape records alone. Random records score alike against
// random originals, so the cut-off comes into force for all entries after 1011 candidates. A
// dark original is unlike all of them but two late candidates, and its running cut-off, the
// score of the first, then rejects the second: this must happen alike.
TEST_F(SelEngineTest, RunsOverManyBanks) {
  SVXDBRec_3 first = RandomShape(*std::make_unique<std::mt19937>(99));
  AddFiles(
      4100, 13,
      {{0, first}, {100, Uniform(0)}, {1500, Uniform(10)}, {1800, Uniform(30)}, {4050, first}});
  {
    SCOPED_TRACE("a plain scan");
    const uint32_t kMax = 10, kMinScore = 20;
    const size_t kOriginals = 12;  // enough to put the cut-off in force early
    RecordingSelEngine run(&engine_);
    ASSERT_EQ(run.InitSelection(MatchSelector(kMax, kMinScore), Originals(kOriginals)), VX_OK);
    CVXResultSet result;
    ASSERT_EQ(run.Run(result), VX_OK);
    ASSERT_EQ(result.Properties().Entries.size(), kOriginals);
    SSelMatch match;
    match.Reset();
    SVXMatchParams params;
    params.SetWeights(match.LumaWeight, match.ColorWeight);
    for (size_t e = 0; e < kOriginals; ++e) {
      const size_t o = e * 7 + 3;
      std::vector<std::pair<double, uint32_t>> expected;
      for (size_t c = 0; c < oids_.size(); ++c) {
        if (c == o) continue;  // never a hit of itself
        // The limits feature counts as a check that always gives 100, and its gate drops a
        // match score below the limit.
        double score = MatchCSQuick(shapes_[o], shapes_[c], params);
        if (score >= kMinScore) expected.emplace_back((100 + score) / 2, oids_[c]);
      }
      // Equal scores keep the order of the candidates.
      std::stable_sort(expected.begin(), expected.end(),
                       [](auto& a, auto& b) { return a.first > b.first; });
      expected.resize(std::min<size_t>(expected.size(), kMax));
      const SVXResultSetEntry& entry = result.Properties().Entries[e];
      EXPECT_EQ(entry.Number, e + 1);
      EXPECT_EQ(entry.OID, oids_[o]);
      ASSERT_EQ(entry.Hits.size(), expected.size()) << "original " << e;
      for (size_t h = 0; h < expected.size(); ++h) {
        EXPECT_EQ(entry.Hits[h].OID, expected[h].second) << "original " << e << " hit " << h;
        EXPECT_DOUBLE_EQ(entry.Hits[h].Score, expected[h].first);
      }
    }
    EXPECT_EQ(run.events.back(), std::make_pair(State::Finished, 0ul));
  }

  struct Setting {
    uint32_t method, precision;
    bool fast, rotate;
    uint32_t weighting, mode, maxResults;
  };
  // Quick on prepared records, with and without Fast; rotated and weighted quick through the
  // plain comparison, the way that fuzzy and duplicates take as well.
  const Setting settings[] = {
      {2, 0, false, false, 0, 1, 10},
      {2, 0, true, false, 0, 1, 3},
      {2, 0, false, true, 2, 1, 10},
  };
  std::vector<SVXFileDescriptor> originals;  // as few as take the way of blocks
  for (size_t i = 0; i < 31; ++i) originals.push_back({oids_[i * 3], 0, CVXURI()});
  originals.push_back({oids_[100], 0, CVXURI()});
  auto run = [&](const CVXSelector& selector, unsigned threads, bool keepAll = false) {
    RecordingSelEngine engine(&engine_);
    engine.SetScoringThreads(threads);
    engine.keepAll = keepAll;
    EXPECT_EQ(engine.InitSelection(selector, originals), VX_OK);
    EXPECT_TRUE(engine.Workers()[0]->ScoresByShapesAlone());
    CVXResultSet result;
    Outcome outcome{engine.Run(result), {}, {}};
    for (const auto& entry : result.Properties().Entries) {
      std::vector<std::pair<uint32_t, double>> hits;
      for (const auto& hit : entry.Hits) hits.emplace_back(hit.OID, hit.Score);
      outcome.entries.emplace_back(entry.Number, entry.OID, hits);
    }
    for (const auto& report : engine.events) {
      if (report.first != State::Progress) outcome.reports.push_back(report);
    }
    return outcome;
  };
  for (const Setting& s : settings) {
    SCOPED_TRACE(testing::Message() << "method " << s.method << " precision " << s.precision
                                    << " fast " << s.fast << " rotate " << s.rotate);
    const CVXSelector selector =
        MatchSelector(s.maxResults, 60, [&](SSelMatch& match, SSelLimits& limits) {
          match.Method = s.method;
          match.Precision = s.precision;
          match.Fast = s.fast;
          match.Rotate = s.rotate;
          match.Weighting = s.weighting;
          limits.Mode = s.mode;
        });
    const Outcome alone = run(selector, 1);
    ASSERT_EQ(alone.code, VX_OK);
    ASSERT_EQ(alone.entries.size(), originals.size());
    EXPECT_EQ(std::get<2>(alone.entries[0]).front().first, oids_[4050]);
    if (s.method == 2 && s.precision == 0 && !s.fast) {  // with Fast a random record may pass
      const auto& dark = std::get<2>(alone.entries.back());
      ASSERT_EQ(dark.size(), 1u);
      EXPECT_EQ(dark[0].first, oids_[1500]);
    }
    EXPECT_TRUE(alone == run(selector, 3));
  }
  // A client's cut-off that falls back must not cost the blocks a hit: every pair scores, the
  // cut-off comes into force after 1010 hits, and from then on follows the last hit.
  const CVXSelector every = MatchSelector(10, 0);
  EXPECT_TRUE(run(every, 1, true) == run(every, 3, true));
}

}  // namespace
