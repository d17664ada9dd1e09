// Arbitrary text through CVXURI::Set, every decomposition and the comparisons. The first byte
// picks the folder flags, the rest splits at its first NUL into two texts. Checks the
// invariants that Set promises, that equality is symmetric and that a URI equals itself.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>

#include "VXURI.h"

namespace {

void Check(bool ok) {
  if (!ok) std::abort();
}

void Exercise(const std::string& text, bool folder) {
  CVXURI uri(text, folder);
  const std::string& s = uri.AsString();
  Check(s.find('\\') == std::string::npos);
  if (text.find_first_of("/\\") != std::string::npos) Check(s.find("://") != std::string::npos);
  if (folder && !text.empty()) Check(s.back() == '/');
  Check(uri.Type() <= CVXURI::Other);
  Check(uri == uri && !(uri < uri));
  Check(uri.WindowsPath().find('/') == std::string::npos || s.find("://") != std::string::npos);
  uri.URIPath();
  uri.Server();
  uri.Path();
  uri.FileName();
  uri.LastName();
  Check(uri.NamePart().size() + uri.ExtPart().size() <= s.size());
  CVXURI::StripTrailer(text);
  CVXURI::MakeWindowsPath(text);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  std::string rest(reinterpret_cast<const char*>(data) + 1, size - 1);
  size_t nul = rest.find('\0');
  std::string a = rest.substr(0, nul);
  std::string b = nul == std::string::npos ? std::string() : rest.substr(nul + 1);
  bool folderA = data[0] & 1, folderB = data[0] & 2;
  Exercise(a, folderA);
  Exercise(b, folderB);
  CVXURI ua(a, folderA), ub(b, folderB);
  Check((ua == ub) == (ub == ua));
  if (ua == ub) Check(!(ua < ub) && !(ub < ua));
  if (folderA != folderB) Check(ua < ub && ub < ua);
  if (folderA == folderB) Check((ua < ub.AsString()) == (ua < ub));
  return 0;
}
