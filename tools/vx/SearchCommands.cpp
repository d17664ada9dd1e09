#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iostream>

#include "Commands.h"
#include "HtmlReport.h"
#include "ImageDecoder.h"

namespace vx {

namespace {

std::string ScoreText(double score) {
  char text[16];
  std::snprintf(text, sizeof text, "%.1f", score);
  return text;
}

// A thumbnail for an image outside the database, made as the importer makes them.
std::vector<uint8_t> ThumbnailOfFile(Database& db, const std::string& path) {
  vxhost::DecodedImage image;
  vxhost::EncodedJpeg jpeg;
  const SVXThumbInfoNew info = db.engine().GetThumbInfo();
  vxhost::DecodeOptions options;
  options.maxSide = db.DecodeSide();
  if (!vxhost::ImageDecoder(options).Decode(path, &image).ok() ||
      !vxhost::EncodeJpegThumbnail(image.pixels.data(), image.width, image.height, info.Width,
                                   info.Height, static_cast<int>(info.Quality), &jpeg)
           .ok()) {
    return {};
  }
  return jpeg.bytes;
}

vxhost::ReportItem Item(Database& db, uint32_t oid, const std::string& score) {
  return {db.FilePath(oid), db.Thumbnail(oid), score};
}

bool WriteHtml(const std::string& path, const std::string& title,
               const std::vector<vxhost::ReportGroup>& groups) {
  std::fflush(stdout);  // the listing comes before the line that names the report
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  if (out) {
    vxhost::HtmlReport report(out, title);
    for (const vxhost::ReportGroup& group : groups) report.AddGroup(group);
    report.Finish();
  }
  if (!out) {
    std::fprintf(stderr, "vx: cannot write %s\n", path.c_str());
    return false;
  }
  std::fprintf(stderr, "report written to %s\n",
               std::filesystem::absolute(path).lexically_normal().c_str());
  return true;
}

void PrintHits(Database& db, const std::string& query, const SearchOptions& options,
               const std::vector<SearchHit>& hits, bool json) {
  if (!json) {
    for (const SearchHit& hit : hits) {
      std::printf("%s\t%s\n", ScoreText(hit.score).c_str(), db.FilePath(hit.oid).c_str());
    }
    return;
  }
  vxhost::JsonWriter w(std::cout);
  w.BeginObject().Key("query").String(query).Key("method").String(
      Search::MethodName(options.method));
  w.Key("results").BeginArray();
  for (const SearchHit& hit : hits) {
    w.BeginObject().Key("score").Double(hit.score).Key("file");
    WriteFileJson(w, db, hit.oid);
    w.EndObject();
  }
  w.EndArray().EndObject();
  std::cout << "\n";
}

void PrintGroups(Database& db, const SearchOptions& options,
                 const std::vector<std::vector<uint32_t>>& groups,
                 const std::vector<SearchPair>& pairs, bool json) {
  if (!json) {
    for (const auto& group : groups) {
      for (size_t i = 0; i < group.size(); ++i) {
        std::printf("%s%s", i ? "\t" : "", db.FilePath(group[i]).c_str());
      }
      std::printf("\n");
    }
    return;
  }
  vxhost::JsonWriter w(std::cout);
  w.BeginObject().Key("method").String(Search::MethodName(options.method));
  w.Key("minScore").Double(options.minScore).Key("groups").BeginArray();
  for (const auto& group : groups) {
    w.BeginArray();
    for (uint32_t oid : group) WriteFileJson(w, db, oid);
    w.EndArray();
  }
  w.EndArray().Key("pairs").BeginArray();
  for (const SearchPair& p : pairs) {
    w.BeginObject().Key("a").String(db.FilePath(p.a)).Key("b").String(db.FilePath(p.b));
    w.Key("score").Double(p.score).EndObject();
  }
  w.EndArray().EndObject();
  std::cout << "\n";
}

}  // namespace

int SimilarCommand(const std::string& path, const std::string& image, const SearchOptions& options,
                   const OutputOptions& output) {
  Database db;
  if (!db.Open(path, true)) return kExitFailure;
  const uint32_t oid = db.FindFile(image);
  std::string external;
  if (oid == 0) {
    external = Database::CanonicalPath(image);
    std::error_code ec;
    if (!std::filesystem::is_regular_file(external, ec)) {
      std::fprintf(stderr, "vx: %s is neither a file of the database nor an image file\n",
                   image.c_str());
      return kExitNotFound;
    }
  }
  std::vector<SearchHit> hits;
  std::string error;
  if (!Search(&db).Similar(oid, external, options, &hits, &error)) {
    std::fprintf(stderr, "vx: %s\n", error.c_str());
    return kExitFailure;
  }
  const std::string query = oid ? db.FilePath(oid) : external;
  PrintHits(db, query, options, hits, output.json);
  if (output.html.empty()) return kExitOk;
  vxhost::ReportGroup original{"Query", {}};
  original.items.push_back(
      {query, oid ? db.Thumbnail(oid) : ThumbnailOfFile(db, external), std::string()});
  vxhost::ReportGroup similar{
      "Similar images (" + std::string(Search::MethodName(options.method)) + ")", {}};
  for (const SearchHit& hit : hits) {
    similar.items.push_back(Item(db, hit.oid, ScoreText(hit.score)));
  }
  return WriteHtml(output.html, "Similar to " + query, {original, similar}) ? kExitOk
                                                                            : kExitFailure;
}

int DupesCommand(const std::string& path, const SearchOptions& options,
                 const OutputOptions& output) {
  Database db;
  if (!db.Open(path, true)) return kExitFailure;
  std::vector<SearchPair> pairs;
  std::string error;
  if (!Search(&db).Pairs(options, &pairs, &error)) {
    std::fprintf(stderr, "vx: %s\n", error.c_str());
    return kExitFailure;
  }
  const auto groups = Search::Group(pairs);
  PrintGroups(db, options, groups, pairs, output.json);
  if (output.html.empty()) return kExitOk;
  std::vector<vxhost::ReportGroup> report;
  for (const auto& group : groups) {
    vxhost::ReportGroup g{"Group " + std::to_string(report.size() + 1), {}};
    for (uint32_t oid : group) {
      double best = 0;
      for (const SearchPair& p : pairs) {
        if (p.a == oid || p.b == oid) best = std::max(best, p.score);
      }
      g.items.push_back(Item(db, oid, ScoreText(best)));
    }
    report.push_back(std::move(g));
  }
  return WriteHtml(output.html, "Near-duplicates", report) ? kExitOk : kExitFailure;
}

}  // namespace vx
