#pragma once

#include <cstdint>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

namespace vxhost {

struct ReportItem {
  std::string title;          // usually the file's path
  std::vector<uint8_t> jpeg;  // thumbnail; empty gives a placeholder box
  std::string score;          // e.g. "97.5"; empty for none
};

struct ReportGroup {
  std::string title;
  std::vector<ReportItem> items;
};

// Writes a self-contained HTML page of groups of images (similar images, duplicates): inline
// CSS, thumbnails as data: URIs, no script and no external resource, so the file can be mailed
// or opened anywhere. The page is written as groups come, so that a large report never sits in
// memory whole: the head at construction, a group per AddGroup, the tail at Finish (or at
// destruction).
class HtmlReport {
 public:
  HtmlReport(std::ostream& out, std::string_view pageTitle);
  ~HtmlReport();
  HtmlReport(const HtmlReport&) = delete;
  HtmlReport& operator=(const HtmlReport&) = delete;

  void AddGroup(const ReportGroup& group);
  void Finish();

  // Text with & < > " ' replaced by entities: safe in element content and quoted attributes.
  static std::string Escape(std::string_view text);
  static std::string Base64(const uint8_t* data, size_t size);

 private:
  void WriteItem_(const ReportItem& item);

  std::ostream& out_;
  size_t groups_ = 0;
  bool finished_ = false;
};

}  // namespace vxhost
