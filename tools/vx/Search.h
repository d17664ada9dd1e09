#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "Database.h"

namespace vx {

enum class MatchMethod { kQuick, kFuzzy, kHistogram, kDuplicates };

struct SearchOptions {
  MatchMethod method = MatchMethod::kQuick;
  bool rotate = false;       // also try the image turned by 90, 180 and 270 degrees
  uint32_t maxResults = 20;  // per original
  bool hasMinScore = false;  // without it the hits are only ranked
  double minScore = 0;
};

struct SearchHit {
  uint32_t oid = 0;
  double score = 0;  // 0 to 100, higher is closer
};

// Two files of the catalog, a < b, with the better of their two scores.
struct SearchPair {
  uint32_t a = 0;
  uint32_t b = 0;
  double score = 0;
};

// Similarity queries through the library's selection run: one original against the catalog,
// or every file against every other in one run. Runs must not overlap within a process.
class Search {
 public:
  explicit Search(Database* db) : db_(db) {}

  // Hits for a file of the catalog (`oid`), or, with `oid` 0, for the image at `path`, which
  // is decoded and measured here. False with `error` set when the run fails.
  bool Similar(uint32_t oid, const std::string& path, const SearchOptions& options,
               std::vector<SearchHit>* hits, std::string* error);
  // Every pair of files with a score of at least options.minScore.
  bool Pairs(const SearchOptions& options, std::vector<SearchPair>* pairs, std::string* error);

  // Joins the pairs into groups (connected components): each group by rising OID, groups by
  // their first OID.
  static std::vector<std::vector<uint32_t>> Group(const std::vector<SearchPair>& pairs);
  static bool ParseMethod(const std::string& name, MatchMethod* method);
  static const char* MethodName(MatchMethod method);
  // The score from which `vx dupes` calls two files near-duplicates.
  static double DupeThreshold(MatchMethod method, bool rotate);
  // The method `vx dupes` uses unless told: the colour histogram, which on the demo collection
  // finds turned, cropped and brightened copies without false pairs.
  static constexpr MatchMethod kDupeMethod = MatchMethod::kHistogram;

 private:
  CVXSelector MakeSelector_(const SearchOptions& options) const;

  Database* db_;
};

}  // namespace vx
