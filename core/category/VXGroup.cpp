#include "VXGroup.h"

#include <algorithm>

#include "VXException.h"
#include "VXFile.h"
#include "VXResult.h"

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
std::vector<SExpr> Version1SExprRead(CVXFile& file) {
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
    g.postfix_ = Version1SExprRead(file);
    g.infix_ = Version1SExprRead(file);
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
  *this = std::move(g);
}

CVXFile& operator<<(CVXFile& file, const CVXGroup& group) {
  group.Write(file);
  return file;
}

CVXFile& operator>>(CVXFile& file, CVXGroup& group) {
  group.Read(file);
  return file;
}
