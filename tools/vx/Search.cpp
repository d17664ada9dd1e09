#include "Search.h"

#include <algorithm>
#include <map>
#include <numeric>
#include <utility>

#include "FileCrc.h"
#include "ImageDecoder.h"

namespace vx {

namespace {

// The shape record's brightness threshold: the one the engine uses for the files it adds, so
// that an outside image compares on equal terms.
constexpr unsigned char kShapeThreshold = 127;

// Takes outside images as originals: decodes them as the importer would and computes their
// shape record. Catalog files go the default way.
class FileSelEngine : public CVXSelEngine {
 public:
  FileSelEngine(CVXEngine* engine, uint32_t decodeSide) : CVXSelEngine(engine) {
    vxhost::DecodeOptions options;
    options.maxSide = decodeSide;
    decoder_ = vxhost::ImageDecoder(options);
  }

  unsigned CreateVXFile(const SVXFileDescriptor& descriptor, CVXCatFile& file,
                        SVXDBRec_3* shape) override {
    if (descriptor.OID != 0) return CVXSelEngine::CreateVXFile(descriptor, file, shape);
    const std::string path = descriptor.URI.NoProtocol();
    vxhost::DecodedImage image;
    vxhost::HostStatus status = decoder_.Decode(path, &image);
    if (!status.ok()) {
      error = path + ": " + status.ToString();
      return VX_NOT_FOUND;
    }
    CVXBitmap bitmap;
    if (vxhost::FillBitmap(image, &bitmap) != VX_OK) {
      error = path + ": no pixels";
      return VX_NOT_FOUND;
    }
    uint32_t crc = 0;
    vxhost::ComputeFileCrc(path, &crc);
    file = CVXCatFile(0, descriptor.URI.FileName(), 0);
    CVXCatFile::SData& data = file.Properties();
    data.Width = image.info.width;
    data.Height = image.info.height;
    data.Format = image.info.format;
    data.CRC = crc;
    if (bitmap.IsGrayScale()) data.Flags |= cfGreyscale;
    if (shape != nullptr) {
      *shape = SVXDBRec_3{};
      CShape().CalcShapeInfo(bitmap, shape->Info, kShapeThreshold);
    }
    return VX_OK;
  }

  std::string error;

 private:
  vxhost::ImageDecoder decoder_;
};

CVXMemFile Blob(SSelCoreData& record) {
  CVXMemFile blob;
  record.Store(&blob, true);
  return blob;
}

// Union-find over OIDs, with path halving.
uint32_t Root(std::map<uint32_t, uint32_t>& parent, uint32_t x) {
  while (parent[x] != x) x = parent[x] = parent[parent[x]];
  return x;
}

}  // namespace

bool Search::Similar(uint32_t oid, const std::string& path, const SearchOptions& options,
                     std::vector<SearchHit>* hits, std::string* error) {
  SVXFileDescriptor original;
  original.OID = oid;
  if (oid == 0) original.URI = CVXURI(path, false);
  FileSelEngine run(&db_->engine(), db_->DecodeSide());
  CVXResultSet result;
  unsigned rc = run.InitSelection(MakeSelector_(options), {original});
  if (rc == VX_OK) rc = run.Run(result);
  if (rc != VX_OK || result.Properties().Entries.size() != 1) {
    *error =
        run.error.empty() ? "the selection failed (error " + std::to_string(rc) + ")" : run.error;
    return false;
  }
  hits->clear();
  for (const SVXRSEntry& hit : result.Properties().Entries[0].Hits) {
    // The run cuts at whole percents.
    if (!options.hasMinScore || hit.Score >= options.minScore) {
      hits->push_back({hit.OID, hit.Score});
    }
  }
  return true;
}

bool Search::Pairs(const SearchOptions& options, std::vector<SearchPair>* pairs,
                   std::string* error) {
  std::vector<SVXFileDescriptor> originals;
  for (uint32_t oid : db_->AllFiles()) originals.push_back({oid, 0, CVXURI()});
  pairs->clear();
  if (originals.size() < 2) return true;
  CVXSelEngine run(&db_->engine());
  CVXResultSet result;
  unsigned rc = run.InitSelection(MakeSelector_(options), originals);
  if (rc == VX_OK) rc = run.Run(result);
  if (rc != VX_OK) {
    *error = "the selection failed (error " + std::to_string(rc) + ")";
    return false;
  }
  // A pair turns up once from each side, with scores that need not agree: keep the better.
  std::map<std::pair<uint32_t, uint32_t>, double> best;
  for (const SVXResultSetEntry& entry : result.Properties().Entries) {
    for (const SVXRSEntry& hit : entry.Hits) {
      if (hit.OID == entry.OID || hit.Score < options.minScore) continue;
      auto key = std::minmax(entry.OID, hit.OID);
      double& score = best[key];
      score = std::max(score, hit.Score);
    }
  }
  for (const auto& [key, score] : best) pairs->push_back({key.first, key.second, score});
  return true;
}

std::vector<std::vector<uint32_t>> Search::Group(const std::vector<SearchPair>& pairs) {
  std::map<uint32_t, uint32_t> parent;
  for (const SearchPair& p : pairs) {
    parent.try_emplace(p.a, p.a);
    parent.try_emplace(p.b, p.b);
    uint32_t a = Root(parent, p.a), b = Root(parent, p.b);
    if (a != b) parent[std::max(a, b)] = std::min(a, b);
  }
  std::map<uint32_t, std::vector<uint32_t>> groups;
  for (const auto& entry : parent) groups[Root(parent, entry.first)].push_back(entry.first);
  std::vector<std::vector<uint32_t>> out;
  out.reserve(groups.size());
  for (auto& [root, members] : groups) out.push_back(std::move(members));
  return out;
}

bool Search::ParseMethod(const std::string& name, MatchMethod* method) {
  static const std::pair<const char*, MatchMethod> kNames[] = {
      {"quick", MatchMethod::kQuick},
      {"fuzzy", MatchMethod::kFuzzy},
      {"histogram", MatchMethod::kHistogram},
      {"duplicates", MatchMethod::kDuplicates},
  };
  for (const auto& [text, value] : kNames) {
    if (name == text) {
      *method = value;
      return true;
    }
  }
  return false;
}

const char* Search::MethodName(MatchMethod method) {
  switch (method) {
    case MatchMethod::kQuick:
      return "quick";
    case MatchMethod::kFuzzy:
      return "fuzzy";
    case MatchMethod::kHistogram:
      return "histogram";
    case MatchMethod::kDuplicates:
      return "duplicates";
  }
  return "quick";
}

// Chosen on the demo collection (twelve photographs, each with five near-duplicates) by the
// sweep in bench/vx_dupes_bench.sh: for each method the score with the best pairwise F1, taken
// where its neighbours score close to it. Turning the images lifts the scores of unrelated pairs
// too, so the shape methods need a higher cut with it; the histogram ignores orientation.
double Search::DupeThreshold(MatchMethod method, bool rotate) {
  switch (method) {
    case MatchMethod::kQuick:
      return 90;
    case MatchMethod::kFuzzy:
      return rotate ? 94 : 84;
    case MatchMethod::kHistogram:
      return 90;
    case MatchMethod::kDuplicates:
      return rotate ? 96 : 92;
  }
  return 90;
}

// The limits record stays inactive: an active one takes part in the score as a check worth
// 100 and would halve the spread of the scores. The run reads its MaxResults, Mode and
// MinScore all the same.
CVXSelector Search::MakeSelector_(const SearchOptions& options) const {
  SSelMatch match;
  match.Reset();
  match.Active = true;
  match.NeedsOriginals = true;
  match.Rotate = options.rotate;
  switch (options.method) {
    case MatchMethod::kDuplicates:
      match.Method = 0;
      break;
    case MatchMethod::kHistogram:
      match.Method = 1;
      break;
    case MatchMethod::kQuick:
    case MatchMethod::kFuzzy:
      match.Method = 2;
      match.Precision = options.method == MatchMethod::kFuzzy ? 1 : 0;
      break;
  }
  SSelLimits limits;
  limits.Reset();
  limits.Active = false;
  limits.MaxResults = std::clamp<uint32_t>(options.maxResults, 1, SSelLimits::kMaxResultsCap);
  limits.Mode = options.hasMinScore ? 1 : 0;
  limits.MinScore = options.hasMinScore ? static_cast<uint32_t>(options.minScore) : 0;
  CVXSelector selector;
  selector.SetFeature(SSelMatch::kKey, Blob(match));
  selector.SetFeature(SSelLimits::kKey, Blob(limits));
  selector.Properties().NeedsOriginals = true;
  return selector;
}

}  // namespace vx
