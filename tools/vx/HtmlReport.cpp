#include "HtmlReport.h"

namespace vxhost {
namespace {

const char kStyle[] =
    "body{font-family:sans-serif;margin:1em;background:#f4f4f4;color:#222}"
    "h1{font-size:1.4em}"
    "section{background:#fff;border:1px solid #ccc;border-radius:4px;margin:0 0 1em;"
    "padding:.5em}"
    "h2{font-size:1em;margin:.2em 0 .5em}"
    ".items{display:flex;flex-wrap:wrap;gap:.5em}"
    "figure{margin:0;width:170px}"
    "figure img,.none{display:block;width:160px;height:160px;object-fit:contain;"
    "background:#eee;border:1px solid #ddd}"
    ".none{display:flex;align-items:center;justify-content:center;color:#888;"
    "font-size:.8em}"
    "figcaption{font-size:.75em;word-break:break-all}"
    ".score{font-weight:bold}";

}  // namespace

HtmlReport::HtmlReport(std::ostream& out, std::string_view pageTitle) : out_(out) {
  std::string title = Escape(pageTitle);
  out_ << "<!DOCTYPE html>\n<html><head><meta charset=\"utf-8\">\n<title>" << title
       << "</title>\n<style>" << kStyle << "</style>\n</head><body>\n<h1>" << title << "</h1>\n";
}

HtmlReport::~HtmlReport() { Finish(); }

void HtmlReport::AddGroup(const ReportGroup& group) {
  ++groups_;
  out_ << "<section><h2>" << Escape(group.title) << "</h2><div class=\"items\">\n";
  for (const auto& item : group.items) WriteItem_(item);
  out_ << "</div></section>\n";
}

void HtmlReport::WriteItem_(const ReportItem& item) {
  std::string title = Escape(item.title);
  out_ << "<figure>";
  if (item.jpeg.empty()) {
    out_ << "<div class=\"none\">no preview</div>";
  } else {
    out_ << "<img alt=\"" << title << "\" src=\"data:image/jpeg;base64,"
         << Base64(item.jpeg.data(), item.jpeg.size()) << "\">";
  }
  out_ << "<figcaption>";
  if (!item.score.empty()) out_ << "<span class=\"score\">" << Escape(item.score) << "</span> ";
  out_ << title << "</figcaption></figure>\n";
}

void HtmlReport::Finish() {
  if (finished_) return;
  finished_ = true;
  if (groups_ == 0) out_ << "<p>Nothing to show.</p>\n";
  out_ << "</body></html>\n";
  out_.flush();
}

std::string HtmlReport::Escape(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (char c : text) {
    switch (c) {
      case '&':
        out += "&amp;";
        break;
      case '<':
        out += "&lt;";
        break;
      case '>':
        out += "&gt;";
        break;
      case '"':
        out += "&quot;";
        break;
      case '\'':
        out += "&#39;";
        break;
      default:
        out += c;
    }
  }
  return out;
}

std::string HtmlReport::Base64(const uint8_t* data, size_t size) {
  static const char kAlphabet[] =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  std::string out;
  out.reserve((size + 2) / 3 * 4);
  for (size_t i = 0; i < size; i += 3) {
    uint32_t v = uint32_t{data[i]} << 16;
    if (i + 1 < size) v |= uint32_t{data[i + 1]} << 8;
    if (i + 2 < size) v |= data[i + 2];
    out += kAlphabet[v >> 18 & 63];
    out += kAlphabet[v >> 12 & 63];
    out += i + 1 < size ? kAlphabet[v >> 6 & 63] : '=';
    out += i + 2 < size ? kAlphabet[v & 63] : '=';
  }
  return out;
}

}  // namespace vxhost
