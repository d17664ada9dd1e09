#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "VXDBObject.h"
#include "bitvector.h"

class CVXFile;

// One stored element of a category formula. The infix and the postfix list hold the same
// record. Objects are referred to by OID, never by name, so renaming needs no formula change.
struct SExpr {
  uint32_t Type = 1;    // ETokenType value
  uint32_t Flags = 0;   // category modifiers
  uint32_t Oid = 0;     // referenced object; for ratings the rating as a signed number
  std::string Text;     // text of "(", ")" and white space
  std::string MediaID;  // folder elements: volume identity, upper case
  std::string MediaSerial;
  std::string Label;  // label elements
  bool operator==(const SExpr&) const = default;
};

// Flag bits of a category that the library acts on; other bits are the host's.
enum : uint32_t {
  gfExclusiveAll = 4,
  gfExclusiveSiblings = 8,
  gfNoChildImages = 16,
  gfSystem = 32,
  gfSealed = 64,
  gfNeedsRecalc = 256,
};

// A category: a named node of the category tree with directly assigned files, child categories
// and optionally a formula. The catalog holds every category by value and hands out copies.
class CVXGroup : public CVXDBObject {
 public:
  static constexpr uint16_t kRecordVersion = 7;

  explicit CVXGroup(uint32_t oid = 0) : CVXDBObject(oid) {}
  // The copy constructor clears InError; assignment copies it.
  CVXGroup(const CVXGroup& other);
  CVXGroup& operator=(const CVXGroup&) = default;
  ~CVXGroup() override = default;

  const std::string& Name() const { return name_; }
  std::string& Name() { return name_; }
  const std::string& Description() const { return description_; }
  std::string& Description() { return description_; }
  uint32_t Parent() const { return parent_; }
  uint32_t& Parent() { return parent_; }
  const std::vector<uint32_t>& Children() const { return children_; }
  std::vector<uint32_t>& Children() { return children_; }
  const CBitVector& Images() const { return images_; }
  CBitVector& Images() { return images_; }
  const std::string& Shortcut() const { return shortcut_; }
  std::string& Shortcut() { return shortcut_; }
  uint32_t Flags() const { return flags_; }
  uint32_t& Flags() { return flags_; }
  uint32_t Color() const { return color_; }
  uint32_t& Color() { return color_; }
  int32_t SortSequence() const { return sortSequence_; }
  int32_t& SortSequence() { return sortSequence_; }
  const std::string& FTITag() const { return ftiTag_; }
  std::string& FTITag() { return ftiTag_; }
  const std::string& FTIPattern() const { return ftiPattern_; }
  std::string& FTIPattern() { return ftiPattern_; }
  uint32_t FTIType() const { return ftiType_; }
  uint32_t& FTIType() { return ftiType_; }
  int32_t FTISubStrStart() const { return ftiSubStrStart_; }
  int32_t& FTISubStrStart() { return ftiSubStrStart_; }
  int32_t FTISubStrLen() const { return ftiSubStrLen_; }
  int32_t& FTISubStrLen() { return ftiSubStrLen_; }
  uint32_t LastActiveOid() const { return lastActiveOid_; }
  uint32_t& LastActiveOid() { return lastActiveOid_; }
  const std::vector<SExpr>& Infix() const { return infix_; }
  std::vector<SExpr>& Infix() { return infix_; }
  const std::vector<SExpr>& Postfix() const { return postfix_; }
  std::vector<SExpr>& Postfix() { return postfix_; }

  bool InError() const { return inError_; }
  bool ImageListDirty() const { return imageListDirty_; }
  void SetImageListDirty(bool dirty) { imageListDirty_ = dirty; }
  bool ChildListDirty() const { return childListDirty_; }
  void SetChildListDirty(bool dirty) { childListDirty_ = dirty; }

  bool IsChildGroup(uint32_t oid) const;
  bool IsSystem() const { return (flags_ & gfSystem) != 0; }
  bool IsSealed() const { return (flags_ & gfSealed) != 0; }
  bool NeedsRecalc() const { return (flags_ & gfNeedsRecalc) != 0; }
  bool IsFTI() const { return !ftiTag_.empty() || !ftiPattern_.empty(); }
  bool IsFTIRoot() const { return !ftiTag_.empty() && ftiPattern_.empty(); }
  bool IsFTIChild() const { return !ftiTag_.empty() && !ftiPattern_.empty(); }

  // The category record (current version 7). Reading accepts every older version; a corrupt or
  // truncated record throws CVXException* (10020) and leaves this object unchanged.
  void Write(CVXFile& file) const;
  void Read(CVXFile& file);

 protected:
  void SetInError(bool inError) { inError_ = inError; }

 private:
  std::string name_;
  std::string description_;
  uint32_t parent_ = 0;
  std::vector<SExpr> infix_;
  std::vector<SExpr> postfix_;
  std::vector<uint32_t> children_;
  CBitVector images_;
  std::string shortcut_;
  uint32_t flags_ = 0;
  uint32_t color_ = 0;
  int32_t sortSequence_ = -1;
  std::string ftiTag_;
  std::string ftiPattern_;
  int32_t ftiSubStrStart_ = 0;
  int32_t ftiSubStrLen_ = 0;
  uint32_t ftiType_ = 0;
  uint32_t lastActiveOid_ = 0;
  bool imageListDirty_ = false;
  bool childListDirty_ = false;
  bool inError_ = false;
};

CVXFile& operator<<(CVXFile& file, const CVXGroup& group);
CVXFile& operator>>(CVXFile& file, CVXGroup& group);
