#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <random>
#include <utility>
#include <vector>

#include "MatchKernels.h"
#include "VXSelEngine.h"
#include "VXSelector.h"
#include "vxengine_fixture.h"

namespace {

using State = CVXSelEngine::EState;
using Events = std::vector<std::pair<State, unsigned long>>;

// Records the feedback of a run and answers false at the `cancelAt`-th call of `cancelState`.
class RecordingSelEngine : public CVXSelEngine {
 public:
  using CVXSelEngine::CVXSelEngine;

  bool Feedback(EState state, unsigned long value) const override {
    events.emplace_back(state, value);
    return !(state == cancelState && ++seen == cancelAt);
  }

  mutable Events events;
  State cancelState = State::Finished;
  int cancelAt = 0;
  mutable int seen = 0;
};

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

// Quick colour-and-shape matching, with the limits given.
CVXSelector MatchSelector(uint32_t maxResults, uint32_t minScore) {
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
  selector.SetFeature(SSelMatch::kKey, Blob(match));
  selector.SetFeature(SSelLimits::kKey, Blob(limits));
  selector.Properties().NeedsOriginals = true;
  return selector;
}

class SelEngineTest : public vxtest::EngineFixture {
 protected:
  // `count` files with random shape records; their OIDs and records are kept.
  void AddFiles(size_t count, uint32_t seed) {
    std::mt19937 rng(seed);
    uint32_t folder = AddFolder("/photos/");
    for (size_t i = 0; i < count; ++i) {
      CVXCatFile file(0, "f" + std::to_string(i) + ".jpg", folder);
      CVXThumb thumb = vxtest::MakeThumb(4, 4, 16, 1);
      SVXDBRec_3 shape = RandomShape(rng);
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

// The run reads shape records through two banks on a second thread and prunes hit lists with a
// running cut-off; its result must be that of scoring every candidate in one plain pass.
TEST_F(SelEngineTest, RunOverManyBanksEqualsAPlainScan) {
  AddFiles(4500, 7);
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
  params.LumaScale = match.LumaWeight * 0.2;
  params.ColorScale = match.ColorWeight * 0.05;
  for (size_t e = 0; e < kOriginals; ++e) {
    const size_t o = e * 7 + 3;
    std::vector<std::pair<double, uint32_t>> expected;
    for (size_t c = 0; c < oids_.size(); ++c) {
      if (c == o) continue;  // never a hit of itself
      // The limits feature counts as a check that always gives 100, and its gate drops a match
      // score below the limit.
      double score = MatchCSQuick(shapes_[o], shapes_[c], params);
      if (score >= kMinScore) expected.emplace_back((100 + score) / 2, oids_[c]);
    }
    std::sort(expected.begin(), expected.end(), [](auto& a, auto& b) { return a.first > b.first; });
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

TEST_F(SelEngineTest, WithoutOriginalsEveryFileIsOneEntrysHit) {
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
}

TEST_F(SelEngineTest, OriginalsAreRequiredWhenTheSelectorNeedsThem) {
  AddFiles(3, 1);
  RecordingSelEngine run(&engine_);
  ASSERT_EQ(run.InitSelection(MatchSelector(10, 0), {}), VX_OK);
  CVXResultSet result;
  EXPECT_EQ(run.Run(result), VX_NEUTRAL_FAILURE);
  EXPECT_TRUE(run.events.empty());
}

// Cancelling ends every stage with Cancelled, then the clean-up's Progress 100, Cancelled and
// Finished; a cancelled main loop keeps its unsorted hits.
TEST_F(SelEngineTest, CancellingAtEachStageEndsWithTheClosingSequence) {
  AddFiles(20, 5);
  const Events tail = {{State::Progress, 100}, {State::Cancelled, 0}, {State::Finished, 0}};
  struct Case {
    State state;
    int at;
    Events before;  // what follows the refused report, up to the common tail
    bool keepsHits;
  };
  const Case cases[] = {
      // making the entries: the walk ends, the preselection is closed
      {State::Progress,
       2,
       {{State::Cancelled, 0}, {State::Progress, 100}, {State::PreselectEnd, 20}},
       false},
      // the first candidate
      {State::Progress, 4, {{State::Cancelled, 0}}, true},
  };
  for (const Case& c : cases) {
    RecordingSelEngine run(&engine_);
    run.cancelState = c.state;
    run.cancelAt = c.at;
    ASSERT_EQ(run.InitSelection(MatchSelector(10, 0), Originals(1)), VX_OK);
    CVXResultSet result;
    EXPECT_EQ(run.Run(result), VX_OK);
    EXPECT_TRUE(run.Aborted());
    Events expected = c.before;
    expected.insert(expected.end(), tail.begin(), tail.end());
    ASSERT_GE(run.events.size(), expected.size() + 1);
    Events last(run.events.end() - static_cast<long>(expected.size()), run.events.end());
    EXPECT_EQ(last, expected) << "cancelled at call " << c.at;
    EXPECT_EQ(!result.Properties().Entries[0].Hits.empty(), c.keepsHits);
  }
}

}  // namespace
