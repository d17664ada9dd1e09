#include "VXURI.h"

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <system_error>
#include <utility>

#include "xstring.h"

namespace {

constexpr const char* kProtocolMark = "://";
constexpr size_t kMaxNameBytes = 255;

// The text before `pos`; empty when `pos` is npos, as a missing separator cuts everything.
std::string Before(const std::string& text, size_t pos) {
  return pos == std::string::npos ? std::string() : text.substr(0, pos);
}

std::string WithTrailingSlash(std::string text) {
  if (!text.empty() && text.back() != '/') text += '/';
  return text;
}

// The text behind "://", or all of it.
std::string BehindProtocol(const std::string& text) {
  size_t mark = text.find(kProtocolMark);
  return mark == std::string::npos ? text : text.substr(mark + 3);
}

bool StartsWithNoCase(const std::string& text, const char* prefix) {
  return _mbsnicmp(text.c_str(), prefix, std::char_traits<char>::length(prefix)) == 0;
}

// Wildcard match of a file search: "*" any run, "?" one byte, ASCII case ignored.
bool WildcardMatch(const std::string& pattern, const std::string& name) {
  auto same = [](char a, char b) {
    return std::tolower(static_cast<unsigned char>(a)) ==
           std::tolower(static_cast<unsigned char>(b));
  };
  size_t p = 0, n = 0, star = std::string::npos, resume = 0;
  while (n < name.size()) {
    if (p < pattern.size() && (pattern[p] == '?' || same(pattern[p], name[n]))) {
      ++p, ++n;
    } else if (p < pattern.size() && pattern[p] == '*') {
      star = p++;
      resume = n;
    } else if (star != std::string::npos) {
      p = star + 1;
      n = ++resume;
    } else {
      return false;
    }
  }
  while (p < pattern.size() && pattern[p] == '*') ++p;
  return p == pattern.size();
}

// As a file search does, a trailing ".*" also matches names without an extension.
bool SearchMatch(const std::string& pattern, const std::string& name) {
  if (WildcardMatch(pattern, name)) return true;
  size_t n = pattern.size();
  return n >= 2 && pattern.compare(n - 2, 2, ".*") == 0 &&
         WildcardMatch(pattern.substr(0, n - 2), name);
}

// True if the search pattern finds any entry. A pattern ending in "/" names a directory and
// finds it if it exists. Never throws: an unreadable directory finds nothing.
bool FindAny(const std::string& pattern) {
  namespace fs = std::filesystem;
  std::error_code ec;
  size_t slash = pattern.rfind('/');
  std::string dir = slash == std::string::npos ? "." : pattern.substr(0, slash + 1);
  std::string name = slash == std::string::npos ? pattern : pattern.substr(slash + 1);
  if (!fs::is_directory(dir, ec)) return false;
  if (name.empty()) return true;
  if (SearchMatch(name, ".") || SearchMatch(name, "..")) return true;
  for (fs::directory_iterator it(dir, ec), end; !ec && it != end; it.increment(ec)) {
    if (SearchMatch(name, it->path().filename().string())) return true;
  }
  return false;
}

// Splits at the last "." of the last component (cut to 255 bytes), or failing that of the whole
// text, so a name without an extension under a dotted path yields path fragments.
std::pair<std::string, std::string> SplitExtension(const std::string& text) {
  size_t slash = text.rfind('/');
  if (slash != std::string::npos) {
    std::string name = text.substr(slash + 1, kMaxNameBytes);
    size_t dot = name.rfind('.');
    if (dot != std::string::npos) return {name.substr(0, dot), name.substr(dot)};
  }
  size_t dot = text.rfind('.');
  if (dot == std::string::npos) return {};
  return {text.substr(0, dot), text.substr(dot)};
}

}  // namespace

void CVXURI::Set(const std::string& text, bool isFolder) {
  isFolder_ = isFolder;
  text_ = Normalize(text, isFolder);
  type_ = TypeFromURI(text_);
  if (isFolder && !text.empty()) text_ = PathFromURI(text_, isFolder);
}

std::string CVXURI::Normalize(const std::string& text, bool /*isFolder*/) {
  std::string out = text;
  std::replace(out.begin(), out.end(), '\\', '/');
  if (out.find('/') != std::string::npos && out.find(kProtocolMark) == std::string::npos) {
    out.insert(0, "file://");
  }
  return out;
}

CVXURI::EType CVXURI::TypeFromURI(const std::string& text) {
  if (text.find(kProtocolMark) == std::string::npos) return File;
  if (StartsWithNoCase(text, "file://")) return File;
  if (StartsWithNoCase(text, "ftp://")) return Ftp;
  if (StartsWithNoCase(text, "http://")) return Http;
  return Other;
}

std::string CVXURI::PathFromURI(const std::string& text, bool isFolder) {
  std::string path = Normalize(text, isFolder);
  if (!isFolder) path = Before(path, path.rfind('/'));
  return WithTrailingSlash(path);
}

std::string CVXURI::URIPath() const {
  return WithTrailingSlash(isFolder_ ? text_ : Before(text_, text_.rfind('/')));
}

std::string CVXURI::StripProtocol(const std::string& text) { return BehindProtocol(text); }

std::string CVXURI::StripTrailer(const std::string& text) {
  if (text.size() >= 4 && (text.back() == '/' || text.back() == '\\')) {
    return text.substr(0, text.size() - 1);
  }
  return text;
}

std::string CVXURI::MakeWindowsPath(const std::string& text) {
  std::string out = text;
  size_t mark = out.find(kProtocolMark);
  size_t from = mark == std::string::npos ? 0 : mark + 3;
  std::replace(out.begin() + static_cast<std::ptrdiff_t>(from), out.end(), '/', '\\');
  return out;
}

std::string CVXURI::Server() const {
  if (type_ == Ftp || type_ == Http) {
    std::string host = BehindProtocol(text_);
    return Before(host, host.find('/'));
  }
  if (type_ != File) return {};
  std::string rest = BehindProtocol(text_);
  if (rest.find(':') != std::string::npos) return rest.substr(0, 2);
  if (rest.compare(0, 2, "//") != 0) return {};
  size_t first = rest.find('/', 2);
  if (first == std::string::npos) return {};
  return Before(rest, rest.find('/', first + 1));
}

std::string CVXURI::Path() const {
  std::string path;
  if (type_ == File) {
    size_t colon = text_.find(':');
    if (colon != std::string::npos && colon + 3 < text_.size()) path = text_.substr(colon + 3);
  } else if (type_ == Ftp || type_ == Http) {
    std::string rest = BehindProtocol(text_);
    size_t slash = rest.find('/');
    if (slash != std::string::npos) path = rest.substr(slash);
  }
  return WithTrailingSlash(Before(path, path.rfind('/')));
}

std::string CVXURI::FileName() const {
  if (isFolder_) return {};
  std::string stripped = StripTrailer(text_);
  size_t slash = stripped.rfind('/');
  return slash == std::string::npos ? text_ : stripped.substr(slash + 1);
}

std::string CVXURI::LastName() const {
  if (!isFolder_) return {};
  std::string stripped = StripTrailer(text_);
  size_t slash = stripped.rfind('/');
  std::string name = slash == std::string::npos ? stripped : stripped.substr(slash + 1);
  if (!name.empty() && name.back() == ':') name += '/';
  return name;
}

std::string CVXURI::NamePart() const { return SplitExtension(text_).first; }

std::string CVXURI::ExtPart() const { return SplitExtension(text_).second; }

bool CVXURI::IsLocal() const {
  if (type_ != File) return false;
  // The probe runs on the text as stored, protocol included, exactly as the search always did.
  return FindAny(isFolder_ ? text_ : text_ + "*.*");
}

int CVXURI::CompareNames(const std::string& a, const std::string& b) {
  return xstring_comparenocase(a, b);
}

bool CVXURI::operator==(const CVXURI& other) const {
  return isFolder_ == other.isFolder_ && CompareNames(text_, other.text_) == 0;
}

bool CVXURI::operator<(const CVXURI& other) const {
  return isFolder_ != other.isFolder_ || CompareNames(text_, other.text_) < 0;
}

bool CVXURI::operator<(const std::string& text) const { return CompareNames(text_, text) < 0; }

CVXURI CVXURI::Restore(std::string text, bool isFolder, uint32_t type) {
  CVXURI uri;
  uri.text_ = std::move(text);
  uri.isFolder_ = isFolder;
  uri.type_ = static_cast<EType>(type);
  return uri;
}
