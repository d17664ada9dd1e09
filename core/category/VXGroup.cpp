#include "VXGroup.h"

#include <algorithm>
#include <cstdio>

#include "VXEngine.h"
#include "VXException.h"
#include "VXFile.h"
#include "VXLog.h"
#include "VXResult.h"
#include "VXURI.h"
#include "vxcatalog.h"
#include "xstring.h"

namespace {

constexpr uint32_t kListMarker = 0xFFEEFFAAu;
constexpr uint16_t kListVersion = 4;

// Every stored element takes at least 12 bytes (two words and one string count), which bounds
// the element count a reader will believe before it allocates.
constexpr uint32_t kMinElementBytes = 12;

void WriteList(CVXFile& file, const std::vector<SExpr>& list) {
  file << kListMarker << kListVersion << static_cast<uint32_t>(list.size());
  for (const SExpr& e : list) {
    file << e.Type << e.Oid << e.Text << e.MediaID << e.MediaSerial << e.Flags << e.Label;
  }
}

void CheckCount(uint32_t count, uint32_t minBytes, uint64_t remaining) {
  if (static_cast<uint64_t>(count) * minBytes > remaining) VX_THROW(VX_NOT_FOUND);
}

std::vector<SExpr> ReadList(CVXFile& file) {
  uint32_t first = 0;
  file >> first;
  uint16_t version = 1;
  uint32_t count = first;
  if (first == kListMarker) file >> version >> count;
  CheckCount(count, kMinElementBytes, file.Remaining());
  std::vector<SExpr> list(count);
  for (SExpr& e : list) {
    file >> e.Type >> e.Oid >> e.Text >> e.MediaID >> e.MediaSerial;
    if (version >= 3) file >> e.Flags;
    if (version >= 4) file >> e.Label;
  }
  return list;
}

// Category records below version 2 kept only type, OID and text per element.
std::vector<SExpr> ReadOldList(CVXFile& file) {
  uint32_t count = 0;
  file >> count;
  CheckCount(count, kMinElementBytes, file.Remaining());
  std::vector<SExpr> list(count);
  for (SExpr& e : list) file >> e.Type >> e.Oid >> e.Text;
  return list;
}

}  // namespace

CVXGroup::CVXGroup(const CVXGroup& other) : CVXDBObject(other) {
  *this = other;
  inError_ = false;
}

void CVXGroup::Version1SExprRead(CVXFile& file, std::vector<SExpr>& list) {
  list = ReadOldList(file);
}

bool CVXGroup::IsChildGroup(uint32_t oid) const {
  return std::find(children_.begin(), children_.end(), oid) != children_.end();
}

void CVXGroup::Write(CVXFile& file) const {
  file << uint16_t{1} << Oid() << kRecordVersion << parent_;
  WriteList(file, postfix_);
  WriteList(file, infix_);
  file << name_ << description_ << images_;
  file << static_cast<uint32_t>(children_.size());
  for (uint32_t child : children_) file << child;
  file << shortcut_ << flags_ << color_ << sortSequence_ << ftiTag_ << ftiPattern_ << ftiType_
       << ftiSubStrStart_ << ftiSubStrLen_ << lastActiveOid_;
}

void CVXGroup::Read(CVXFile& file) {
  // Read into a fresh object so that a failure leaves this one as it was.
  CVXGroup g;
  uint16_t header = 0, version = 0;
  uint32_t oid = 0;
  file >> header >> oid >> version >> g.parent_;
  g.Oid() = oid;
  if (version < 2) {
    Version1SExprRead(file, g.postfix_);
    Version1SExprRead(file, g.infix_);
  } else {
    g.postfix_ = ReadList(file);
    g.infix_ = ReadList(file);
  }
  file >> g.name_ >> g.description_ >> g.images_;
  uint32_t count = 0;
  file >> count;
  for (uint32_t i = 0; i < count; ++i) {
    uint32_t child = 0;
    file >> child;
    g.children_.push_back(child);
  }
  file >> g.shortcut_;
  if (version >= 3) file >> g.flags_ >> g.color_;
  if (version >= 4) file >> g.sortSequence_;
  if (version >= 5) file >> g.ftiTag_ >> g.ftiPattern_;
  if (version >= 6) file >> g.ftiType_ >> g.ftiSubStrStart_ >> g.ftiSubStrLen_;
  if (version >= 7) file >> g.lastActiveOid_;
  g.inError_ = inError_;
  *this = g;
}

CVXFile& operator<<(CVXFile& file, const CVXGroup& group) {
  group.Write(file);
  return file;
}

CVXFile& operator>>(CVXFile& file, CVXGroup& group) {
  group.Read(file);
  return file;
}

// ---- Order

bool CVXGroup::operator<(const CVXGroup& other) const {
  if (sortSequence_ != other.sortSequence_) return sortSequence_ < other.sortSequence_;
  return name_ < other.name_;  // byte-wise, with case: "B" before "a"
}

bool CVXGroup::operator==(const CVXGroup& other) const {
  return _mbsicmp(name_.c_str(), other.name_.c_str()) == 0;
}

// ---- Files and children

unsigned CVXGroup::AddImage(CVXCatalog& catalog, uint32_t fileOid) {
  if (IsAll()) return VX_OK;
  if (fileOid >= CBitVector::npos - 1) return VX_RANGE;
  if (flags_ & gfExclusiveAll) {
    catalog.RemoveImageFromGroups(fileOid, 0);
  } else if (flags_ & gfExclusiveSiblings) {
    catalog.RemoveImageFromGroups(fileOid, parent_);
  }
  imageListDirty_ = true;
  if (images_.Get(fileOid)) return VX_ALREADY_PRESENT;
  images_.Set(fileOid);  // grows to the OID plus 33 bits when too short
  return VX_OK;
}

unsigned CVXGroup::AddImage(CVXCatalog& catalog, const std::vector<uint32_t>& fileOids) {
  if (IsAll()) return VX_OK;
  bool added = false;
  for (uint32_t oid : fileOids) added |= AddImage(catalog, oid) == VX_OK;
  imageListDirty_ = true;
  return added ? VX_OK : VX_ALREADY_PRESENT;
}

unsigned CVXGroup::RemoveImage(uint32_t fileOid) {
  if (IsAll()) return VX_OK;
  imageListDirty_ = true;
  if (!images_.Get(fileOid)) return VX_NOT_FOUND;
  images_.Reset(fileOid);
  return VX_OK;
}

unsigned CVXGroup::RemoveImage(const std::vector<uint32_t>& fileOids) {
  if (IsAll()) return VX_OK;
  for (uint32_t oid : fileOids) RemoveImage(oid);
  imageListDirty_ = true;
  return VX_OK;
}

unsigned CVXGroup::AddChild(uint32_t oid) {
  if (IsAll()) return VX_OK;
  if (IsChildGroup(oid)) return VX_ALREADY_PRESENT;
  children_.push_back(oid);
  childListDirty_ = true;
  return VX_OK;
}

// A successful removal leaves ChildListDirty alone, a failed one sets it; hosts rely on this.
unsigned CVXGroup::RemoveChild(uint32_t oid) {
  if (IsAll()) return VX_OK;
  auto it = std::find(children_.begin(), children_.end(), oid);
  if (it == children_.end()) {
    childListDirty_ = true;
    return VX_NOT_FOUND;
  }
  children_.erase(it);
  return VX_OK;
}

// ---- Formula

namespace {

CQRLLogfile* LogOf(const CVXCatalog& catalog) {
  return catalog.GetEngine() ? catalog.GetEngine()->LogFile() : nullptr;
}

SError Failed(uint32_t code, int32_t position) { return {code, position}; }

int32_t PositionOf(const SToken& token) { return static_cast<int32_t>(token.position); }

// The folders are tried in map order. The media identity always takes part; the serial only
// when the formula gives one, so a formula without a suffix matches only a folder without media.
uint32_t FindFolder(const CVXCatalog& catalog, const CVXURI& uri, const SExpr& e) {
  for (const auto& [oid, folder] : catalog.Folders()) {
    if (xstring_comparenocase(e.MediaID, folder.MediaID()) != 0) continue;
    if (!e.MediaSerial.empty() && xstring_comparenocase(e.MediaSerial, folder.MediaSerial()) != 0) {
      continue;
    }
    if (folder.URI() == uri) return oid;
  }
  return 0;
}

std::string Quoted(const std::string& text) { return "\"" + text + "\""; }

}  // namespace

SError CVXGroup::SetExpression(CVXCatalog& catalog, const std::string& text) {
  inError_ = false;
  imageListDirty_ = true;
  childListDirty_ = true;
  if (IsAll()) return {VX_OK, -1};
  if (text.empty()) {
    infix_.clear();
    postfix_.clear();
    return {VX_OK, -1};
  }
  CQRLLogfile* log = LogOf(catalog);
  CVXGroupParser parser;
  std::vector<SToken> tokens;
  SError error = parser.Parse(text, tokens);
  std::vector<SToken> postfix = tokens;
  if (error.code == VX_OK) error = parser.ConvertToStack(postfix);
  if (error.code != VX_OK) {
    VX_ERROR(log, error.code, "CVXGroup::SetExpression: parse");
    return error;
  }
  const SError parsed = error;  // on success: the length of the text
  if (ResolveCategories_(catalog, postfix, error) != VX_OK) {
    inError_ = true;
    VX_ERROR(log, error.code, "CVXGroup::SetExpression: reference");
    return error;
  }
  infix_.clear();
  postfix_.clear();
  error = ConvertTokenStream(catalog, tokens, infix_);
  if (error.code == VX_OK) error = ConvertTokenStream(catalog, postfix, postfix_);
  if (error.code != VX_OK) {
    VX_ERROR(log, error.code, "CVXGroup::SetExpression: convert");
    return error;
  }
  VX_LOG(log, 3, "CVXGroup::SetExpression: formula set");
  return parsed;
}

// Checks every category the formula names before anything is replaced: it must exist, and it
// must be neither this category, nor one of its parents, nor depend on this category. The last
// test looks at every token, and the last token that fails it decides the code.
unsigned CVXGroup::ResolveCategories_(CVXCatalog& catalog, const std::vector<SToken>& postfix,
                                      SError& error) {
  std::vector<uint32_t> parents;
  for (uint32_t p = parent_; p != 0;) {
    if (std::find(parents.begin(), parents.end(), p) != parents.end()) break;  // looped chain
    CVXGroup parent;
    if (catalog.LookupGroup(p, parent) != VX_OK) {
      error = Failed(VX_NOT_FOUND, -1);
      return error.code;
    }
    parents.push_back(p);
    p = parent.Parent();
  }
  error = {VX_OK, -1};
  for (const SToken& token : postfix) {
    if (token.type != ttCategory) continue;
    uint32_t oid = catalog.LookupGroup(token.text);
    if (oid == 0) {
      error = Failed(VX_FORMULA_NO_CATEGORY, PositionOf(token));
      return error.code;
    }
    if (oid == Oid() || std::find(parents.begin(), parents.end(), oid) != parents.end()) {
      error = Failed(VX_FORMULA_CIRCULAR, PositionOf(token));
      return error.code;
    }
    bool depends = false;
    if (catalog.GroupDependsOn(oid, Oid(), depends) != VX_OK) {
      error = Failed(VX_FORMULA_NO_CATEGORY, PositionOf(token));
    } else if (depends) {
      error = Failed(VX_FORMULA_CIRCULAR, PositionOf(token));
    }
  }
  return error.code;
}

// MediaID, MediaSerial and Label carry over from one element to the next: only the fields a
// token type sets are rewritten. Stored formulas have always been built this way.
SError CVXGroup::ConvertTokenStream(CVXCatalog& catalog, const std::vector<SToken>& tokens,
                                    std::vector<SExpr>& out) {
  SExpr e;
  for (const SToken& token : tokens) {
    e.Type = token.type;
    e.Flags = token.flags;
    e.Oid = 0;
    e.Text.clear();
    switch (token.type) {
      case ttOpen:
      case ttClose:
      case ttSpace:
        e.Text = token.text;
        break;
      case ttRating:
        ParseIndex(token.text, e.Oid);
        break;
      case ttLabel:
        ParseIndex(token.text, e.Label);
        break;
      case ttPersSel:
        if (catalog.GetPersSelOid(token.text, e.Oid) != VX_OK) {
          return Failed(VX_FORMULA_NO_PERSSEL, -1);
        }
        break;
      case ttCategory:
        e.Oid = catalog.LookupGroup(token.text);
        if (e.Oid == 0) return Failed(VX_FORMULA_NO_CATEGORY, -1);
        break;
      case ttFolder:
      case ttRFolder: {
        CVXURI uri;
        ParseFolderToken(token.text, uri, e);
        e.Oid = FindFolder(catalog, uri, e);
        if (e.Oid == 0) return Failed(VX_FORMULA_NO_FOLDER, -1);
        break;
      }
      default:
        break;
    }
    out.push_back(e);
  }
  return {VX_OK, -1};
}

void CVXGroup::ParseFolderToken(const std::string& text, CVXURI& uri, SExpr& e) {
  e.MediaID.clear();
  e.MediaSerial.clear();
  size_t open = text.find('<');
  if (open == std::string::npos) {
    uri.Set(text, true);
    return;
  }
  uri.Set(text.substr(0, open), true);
  size_t dot = text.find('.', open + 1);
  size_t close = dot == std::string::npos ? dot : text.find('>', dot + 1);
  if (close == std::string::npos) return;  // a suffix cut short counts as none
  e.MediaID = _mbsupr(text.substr(open + 1, dot - open - 1));
  e.MediaSerial = _mbsupr(text.substr(dot + 1, close - dot - 1));
}

namespace {

bool Bracketed(const std::string& text, std::string& inside) {
  size_t open = text.find('[');
  if (open == std::string::npos) return false;
  size_t close = text.find(']', open + 1);
  if (close == std::string::npos) return false;
  inside = text.substr(open + 1, close - open - 1);
  Trim(inside, xstBoth);
  return true;
}

}  // namespace

void CVXGroup::ParseIndex(const std::string& text, uint32_t& value) {
  std::string inside;
  if (Bracketed(text, inside)) value = static_cast<uint32_t>(KTUnicode::StringToLong(inside));
}

void CVXGroup::ParseIndex(const std::string& text, std::string& value) {
  std::string inside;
  if (Bracketed(text, inside)) value = inside;
}

namespace {

// One element as formula text; false when the object it names is gone.
bool PrintElement(const CVXCatalog& catalog, const SExpr& e, std::string& out) {
  switch (e.Type) {
    case ttAnd:
      out += "AND";
      return true;
    case ttOr:
      out += "OR";
      return true;
    case ttNot:
      out += "NOT";
      return true;
    case ttOpen:
      out += "(";
      return true;
    case ttClose:
      out += ")";
      return true;
    case ttSpace:
      out += e.Text;
      return true;
    case ttRating:
      out += Quoted("@Rating[" + std::to_string(static_cast<int32_t>(e.Oid)) + "]");
      return true;
    case ttLabel:
      out += Quoted("@Label[" + e.Label + "]");
      return true;
    case ttUnassigned:
      out += Quoted("@Unassigned");
      return true;
    case ttPersSel:
      return false;  // selection names are not readable in this build
    case ttCategory: {
      std::string name;
      if (catalog.GetFullGroupName(e.Oid, name) != VX_OK) return false;
      const char* prefix = (e.Flags & tfNoRecurse)  ? "CatNoRecurse@"
                           : (e.Flags & tfDistinct) ? "CatDistinct@"
                                                    : "";
      out += Quoted(prefix + name);
      return true;
    }
    case ttFolder:
    case ttRFolder: {
      auto it = catalog.Folders().find(e.Oid);
      if (it == catalog.Folders().end()) return false;
      std::string text =
          (e.Type == ttFolder ? "Folder@" : "RFolder@") + it->second.URI().AsString();
      if (!e.MediaSerial.empty()) text += "<" + e.MediaID + "." + e.MediaSerial + ">";
      out += Quoted(text);
      return true;
    }
    default:
      return false;
  }
}

}  // namespace

std::string CVXGroup::Expression(const CVXCatalog& catalog) const {
  std::string text;
  for (const SExpr& e : infix_) {
    if (!PrintElement(catalog, e, text)) break;
  }
  return text;
}

std::string CVXGroup::CleanName(const std::string& text) {
  static const std::string kReserved = "\"./=@[\\]";
  std::string name = text.substr(0, 64);
  for (char& c : name) {
    auto byte = static_cast<unsigned char>(c);
    if (!_ismbcalnum(byte) && kReserved.find(c) != std::string::npos) c = '_';
  }
  return name;
}
