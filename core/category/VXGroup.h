#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "VXDBObject.h"
#include "VXGroupParser.h"
#include "bitvector.h"

class CVXCatalog;
class CVXFile;
class CVXURI;

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

// What a reference test looks for.
enum ERefType : unsigned {
  refCategory = 0,
  refFolder = 1,
  refSelection = 2,
};

// One element of the working list of an evaluation: a formula operand with its file set, or an
// intermediate result (type ttResult).
struct SStackEntry {
  uint32_t Type = ttEnd;
  uint32_t Flags = 0;
  uint32_t Oid = 0;
  CBitVector Files;  // filled by Fill
  std::string Label;
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

  // Orders by SortSequence (signed), then by Name byte-wise with case.
  bool operator<(const CVXGroup& other) const;
  // Compares Name only, without case. Deliberately not the order of operator<.
  bool operator==(const CVXGroup& other) const;

  // ---- Files and children. Every mutating call is a no-op returning 10001 on "@All".
  // Adds a file; with gfExclusiveAll (or else gfExclusiveSiblings) the file is first taken out of
  // every category (or of the parent's subtree) through the catalog. 10120 if already set,
  // 10090 for an OID no set can hold. Sets ImageListDirty.
  unsigned AddImage(CVXCatalog& catalog, uint32_t fileOid);
  // 10001 if any file was added, else 10120 (also for an empty list).
  unsigned AddImage(CVXCatalog& catalog, const std::vector<uint32_t>& fileOids);
  // 10020 if the bit was not set. Sets ImageListDirty either way.
  unsigned RemoveImage(uint32_t fileOid);
  // Files that were not set are no failure: always 10001.
  unsigned RemoveImage(const std::vector<uint32_t>& fileOids);
  // 10120 if present; otherwise appended and ChildListDirty set.
  unsigned AddChild(uint32_t oid);
  // 10020 if absent, which sets ChildListDirty; a removal leaves the flag as it is.
  unsigned RemoveChild(uint32_t oid);

  // ---- Formula.
  // Parses `text`, resolves every name to an OID and stores the infix and postfix lists.
  // Parse faults keep the old lists and InError clear. A missing parent (10020), an unknown
  // category (15010) or a reference back to this category or its parents (15014) sets InError
  // and keeps the old lists. A missing folder (15011) or selection (15012) found while the lists
  // are rebuilt leaves them partly converted, InError clear. Positions are byte offsets, -1
  // where none applies.
  SError SetExpression(CVXCatalog& catalog, const std::string& text);
  // The formula as text with the current names of what it refers to. Printing stops at the
  // first element whose object is gone, returning what stands so far.
  std::string Expression(const CVXCatalog& catalog) const;
  // A name fit for a category: reserved punctuation becomes "_", at most 64 bytes.
  static std::string CleanName(const std::string& text);

  // ---- Reference tests. All answer false on "@All".
  // Whether the postfix list names `oid` as an object of that kind.
  bool HasReference(uint32_t oid, unsigned refType) const;
  // Whether this category reaches `oid` through its children or its formula. A category that
  // cannot be looked up, or a loop met on the way, counts as a reference.
  bool HasGroupReference(const CVXCatalog& catalog, uint32_t oid) const;
  // Points the first reference to folder `oldOid` at folder `newOid` (OID and media). True if
  // the postfix list changed; the caller then stores the category. False if `newOid` is absent.
  bool UpdateFolderReference(const CVXCatalog& catalog, uint32_t oldOid, uint32_t newOid);

  // ---- Calculation: assigned files, formula and children, recomputed at every call.
  // 15014 when in error, on a cycle through formulas or children, or when a category the
  // formula names has gone; 10000 when an exception ends it (InError set); 10020 for a missing
  // child or folder or a failed full-text query; 15000 and 15013 for a formula that cannot be
  // reduced or filled. Any formula failure sets InError. What was computed up to a failure
  // stays in `out`. The vector form gives rising OIDs.
  unsigned Calculate(CVXCatalog& catalog, std::vector<uint32_t>& out);
  unsigned Calculate(CVXCatalog& catalog, CBitVector& out);
  // Whether the calculated content holds the file; a failed calculation answers from what it
  // left.
  bool HasImage(CVXCatalog& catalog, uint32_t fileOid);

  // The category record (current version 7). Reading accepts every older version; a corrupt or
  // truncated record throws CVXException* (10020) and leaves this object unchanged.
  void Write(CVXFile& file) const;
  void Read(CVXFile& file);
  // A formula list of a record below version 2 (type, OID and text per element); throws
  // CVXException* (10020) on a short or corrupt list, leaving `list` unchanged.
  static void Version1SExprRead(CVXFile& file, std::vector<SExpr>& list);

 protected:
  void SetInError(bool inError) { inError_ = inError; }

  // `cycle` holds the OIDs of the categories on the current path of calculation.
  unsigned Calc(CVXCatalog& catalog, CBitVector& cycle, std::vector<uint32_t>& out);
  unsigned Calc(CVXCatalog& catalog, CBitVector& cycle, CBitVector& out);
  // The formula of this category alone.
  unsigned Evaluate(CVXCatalog& catalog, CBitVector& cycle, CBitVector& out);
  // Fills the entry's file set from the object it names.
  unsigned Fill(CVXCatalog& catalog, SStackEntry& entry, CBitVector& cycle);

 private:
  bool IsAll() const { return Oid() == VX_ALL_GROUP_OID; }
  SError ConvertTokenStream(CVXCatalog& catalog, const std::vector<SToken>& tokens,
                            std::vector<SExpr>& out);
  // Splits folder text "path<MEDIA.SERIAL>" into the URI and the media strings of `e`.
  static void ParseFolderToken(const std::string& text, CVXURI& uri, SExpr& e);
  // The trimmed text between "[" and "]"; the target is unchanged without both.
  static void ParseIndex(const std::string& text, uint32_t& value);
  static void ParseIndex(const std::string& text, std::string& value);
  unsigned ResolveCategories_(CVXCatalog& catalog, const std::vector<SToken>& postfix,
                              SError& error);
  // Runs on the outermost category for `group`, which walks down through the children.
  unsigned InnerCalculate_(const CVXGroup& group, CBitVector& cycle, CVXCatalog& catalog,
                           CBitVector& out);
  unsigned CalculateDataDriven_(const CVXGroup& group, CVXCatalog& catalog, CBitVector& out);
  unsigned EvaluateChecks_(CVXCatalog& catalog, const std::vector<SStackEntry>& list);
  unsigned Reduce_(CVXCatalog& catalog, std::vector<SStackEntry>& list, CBitVector& cycle,
                   CBitVector& out);
  unsigned FillCategory_(CVXCatalog& catalog, SStackEntry& entry, CBitVector& cycle);
  unsigned GetFolderFilesRecursive(const CVXCatalog& catalog, uint32_t folderOid,
                                   CBitVector& out) const;
  bool HasGroupReference_(const CVXCatalog& catalog, uint32_t oid, CBitVector& onPath,
                          CBitVector& done) const;

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
