// Calculation of a category's files and the reference tests over its formula.
//
// Content = assigned files | formula | content of every child, all as CBitVectors indexed by
// file OID. Nothing is cached except the Images of data-driven categories. The cycle set holds
// the categories on the current path, so a loop through Children or through formula references
// ends with 15014 at its second arrival.

#include <algorithm>
#include <exception>

#include "FTIText.h"
#include "VXEngine.h"
#include "VXException.h"
#include "VXGroup.h"
#include "VXLog.h"
#include "VXResult.h"
#include "VXXMPDB.h"
#include "vxcatalog.h"

namespace {

void FilesOf(const CVXFolder& folder, CBitVector& out) {
  for (uint32_t oid : folder.Files()) out.SetBulk(oid);
}

bool IsOperand(uint32_t type) { return (type & kTokenOperandMask) != 0; }
bool IsOperator(uint32_t type) { return (type & kTokenOperatorMask) != 0; }

}  // namespace

// ---- Calculate

unsigned CVXGroup::Calculate(CVXCatalog& catalog, std::vector<uint32_t>& out) {
  if (inError_) {
    out.clear();
    return VX_FORMULA_CIRCULAR;
  }
  unsigned rc;
  try {
    CBitVector cycle;
    rc = Calc(catalog, cycle, out);
  } catch (CVXException* e) {
    delete e;
    rc = VX_NEUTRAL_FAILURE;
  } catch (...) {
    rc = VX_NEUTRAL_FAILURE;
  }
  if (rc == VX_FORMULA_CIRCULAR || rc == VX_NEUTRAL_FAILURE) inError_ = true;
  return rc;
}

unsigned CVXGroup::Calculate(CVXCatalog& catalog, CBitVector& out) {
  if (inError_) return VX_FORMULA_CIRCULAR;
  try {
    CBitVector cycle;
    return Calc(catalog, cycle, out);
  } catch (CVXException* e) {
    delete e;
  } catch (...) {
  }
  inError_ = true;
  return VX_NEUTRAL_FAILURE;
}

unsigned CVXGroup::Calc(CVXCatalog& catalog, CBitVector& cycle, std::vector<uint32_t>& out) {
  out.clear();
  CBitVector bits;
  unsigned rc = InnerCalculate_(*this, cycle, catalog, bits);
  bits.Convert(out);
  return rc;
}

unsigned CVXGroup::Calc(CVXCatalog& catalog, CBitVector& cycle, CBitVector& out) {
  return InnerCalculate_(*this, cycle, catalog, out);
}

// `this` stays the category the caller asked for: its InError and its own gfNoChildImages and
// formula decide, while `group` walks down through the children.
unsigned CVXGroup::InnerCalculate_(const CVXGroup& group, CBitVector& cycle, CVXCatalog& catalog,
                                   CBitVector& out) {
  if (inError_) return VX_FORMULA_CIRCULAR;
  if (group.IsAll()) return catalog.GetFiles(out);
  if (group.IsFTI()) return CalculateDataDriven_(group, catalog, out);
  const uint32_t oid = group.Oid();
  if (cycle.Get(oid)) {
    inError_ = true;
    return VX_FORMULA_CIRCULAR;
  }
  cycle.Set(oid);
  out = group.images_;
  unsigned rc = VX_OK;
  if (!(postfix_.empty() && (flags_ & gfNoChildImages))) {
    CBitVector formula;
    CVXGroup g = group;  // Evaluate may mark the category it runs on
    rc = g.Evaluate(catalog, cycle, formula);
    if (rc != VX_OK) {
      inError_ = true;
    } else {
      out |= formula;
      for (uint32_t childOid : group.children_) {
        CVXGroup child;
        if ((rc = catalog.LookupGroup(childOid, child)) != VX_OK) break;
        CBitVector content;
        if ((rc = InnerCalculate_(child, cycle, catalog, content)) != VX_OK) break;
        out |= content;
      }
    }
  }
  cycle.Reset(oid);
  return rc;
}

// A data-driven category reuses its stored Images until gfNeedsRecalc asks for a new query.
// The query result is stored on the catalog's record; `group` keeps its flag.
unsigned CVXGroup::CalculateDataDriven_(const CVXGroup& group, CVXCatalog& catalog,
                                        CBitVector& out) {
  CBitVector existing;
  catalog.GetFiles(existing);
  if (!group.NeedsRecalc()) {
    out = group.images_;
    out &= existing;
    return VX_OK;
  }
  CVXEngine* engine = catalog.GetEngine();
  if (!engine) return VX_NOT_FOUND;
  // The pattern goes to the index as a quoted literal; an empty one asks for every file that
  // has the tag.
  std::string query = group.ftiPattern_.empty() ? std::string() : FTIText::Quote(group.ftiPattern_);
  std::vector<uint32_t> oids;
  if (engine->XMPDB().FTIQuery(group.ftiTag_, query, CVXXMPDB::fqExact, oids, group.ftiSubStrStart_,
                               group.ftiSubStrLen_) != 0) {
    return VX_NOT_FOUND;
  }
  out.Clear();
  for (uint32_t oid : oids) out.SetBulk(oid);
  out &= existing;
  CVXGroup cached = group;
  cached.flags_ &= ~gfNeedsRecalc;
  cached.images_ = out;
  catalog.UpdateGroup(cached);
  return VX_OK;
}

// ---- Evaluate

unsigned CVXGroup::Evaluate(CVXCatalog& catalog, CBitVector& cycle, CBitVector& out) {
  out.Clear();
  if (postfix_.empty()) return VX_OK;
  std::vector<SStackEntry> list;
  for (const SExpr& e : postfix_) {
    if (e.Type == ttSpace) continue;
    list.push_back({e.Type, e.Flags, e.Oid, CBitVector(), e.Label});
  }
  if (unsigned rc = EvaluateChecks_(catalog, list); rc != VX_OK) return rc;
  if (list.size() == 1) {
    if (!IsOperand(list[0].Type)) return VX_OK;
    unsigned rc = Fill(catalog, list[0], cycle);
    if (rc == VX_OK) out = std::move(list[0].Files);
    return rc;
  }
  return Reduce_(catalog, list, cycle, out);
}

// A referenced category that depends on this one would lead the calculation back here; it is
// refused before anything is filled. Each category is asked once: the answers cannot change
// while the list is built.
unsigned CVXGroup::EvaluateChecks_(CVXCatalog& catalog, const std::vector<SStackEntry>& list) {
  for (const SStackEntry& entry : list) {
    if (entry.Type != ttCategory) continue;
    bool depends = false;
    if (catalog.GroupDependsOn(entry.Oid, Oid(), depends) != VX_OK || depends) {
      inError_ = true;
      return VX_FORMULA_CIRCULAR;
    }
  }
  return VX_OK;
}

// Operators rank alike and group from the left: the first operator in the list takes the two
// entries before it, and the three become one result. Formulas are short, so the list is
// rescanned from the head at each step.
unsigned CVXGroup::Reduce_(CVXCatalog& catalog, std::vector<SStackEntry>& list, CBitVector& cycle,
                           CBitVector& out) {
  for (;;) {
    if (list.size() <= 2) {
      if (list.size() != 1 || list[0].Type != ttResult) return VX_FORMULA_OPERAND_EXPECTED;
      out = std::move(list[0].Files);
      return VX_OK;
    }
    auto op = std::find_if(list.begin(), list.end(),
                           [](const SStackEntry& e) { return IsOperator(e.Type); });
    if (op == list.end() || op - list.begin() < 2) return VX_FORMULA_OPERAND_EXPECTED;
    SStackEntry& left = *(op - 2);
    SStackEntry& right = *(op - 1);
    if (Fill(catalog, left, cycle) != VX_OK || Fill(catalog, right, cycle) != VX_OK) {
      return VX_FORMULA_OPERAND_FAILED;
    }
    if (op->Type == ttAnd) {
      left.Files &= right.Files;
    } else if (op->Type == ttOr) {
      left.Files |= right.Files;
    } else {
      left.Files.AndNot(right.Files);
    }
    left.Type = ttResult;
    list.erase(op - 1, op + 1);
  }
}

// ---- Fill

unsigned CVXGroup::Fill(CVXCatalog& catalog, SStackEntry& entry, CBitVector& cycle) {
  if (entry.Type == ttResult) return VX_OK;
  entry.Files.Clear();
  switch (entry.Type) {
    case ttCategory:
      return FillCategory_(catalog, entry, cycle);
    case ttFolder: {
      auto it = catalog.Folders().find(entry.Oid);
      if (it == catalog.Folders().end()) return VX_NOT_FOUND;
      FilesOf(it->second, entry.Files);
      return VX_OK;
    }
    case ttRFolder:
      return GetFolderFilesRecursive(catalog, entry.Oid, entry.Files);
    case ttPersSel:
      // Stored selections are not readable in this build: the set stays empty.
      return VX_NOT_FOUND;
    case ttUnassigned:
      return catalog.GetUnassignedImages(entry.Files);
    case ttRating:
      return catalog.GetRank(static_cast<int32_t>(entry.Oid), entry.Files);
    case ttLabel:
      return catalog.GetLabel(entry.Label.c_str(), entry.Files);
    default:
      return VX_OK;  // ttSelection and anything unknown: an empty set
  }
}

// CatNoRecurse: the assigned files alone. CatDistinct: the assigned files that no other
// category has assigned. Plain: the whole content, calculated through the shared cycle set.
unsigned CVXGroup::FillCategory_(CVXCatalog& catalog, SStackEntry& entry, CBitVector& cycle) {
  CVXGroup group;
  if (catalog.LookupGroup(entry.Oid, group) != VX_OK) return VX_NOT_FOUND;
  if (entry.Flags & tfNoRecurse) {
    entry.Files = group.images_;
    return VX_OK;
  }
  if (!(entry.Flags & tfDistinct)) return group.Calc(catalog, cycle, entry.Files);
  entry.Files = group.images_;
  std::vector<uint32_t> all;
  catalog.GetGroups(all);
  for (uint32_t oid : all) {
    if (entry.Files.IsEmpty()) break;
    if (oid == entry.Oid) continue;
    auto it = catalog.Groups().find(oid);
    if (it != catalog.Groups().end()) entry.Files.AndNot(it->second.images_);
  }
  return VX_OK;
}

// A folder met twice (a damaged tree) is not walked again, so the walk always ends.
unsigned CVXGroup::GetFolderFilesRecursive(const CVXCatalog& catalog, uint32_t folderOid,
                                           CBitVector& out) const {
  CBitVector seen;
  std::vector<uint32_t> pending{folderOid};
  while (!pending.empty()) {
    uint32_t oid = pending.back();
    pending.pop_back();
    if (seen.Get(oid)) continue;
    seen.Set(oid);
    auto it = catalog.Folders().find(oid);
    if (it == catalog.Folders().end()) return VX_NOT_FOUND;
    FilesOf(it->second, out);
    const std::vector<uint32_t>& children = it->second.Children();
    pending.insert(pending.end(), children.rbegin(), children.rend());
  }
  return VX_OK;
}

bool CVXGroup::HasImage(CVXCatalog& catalog, uint32_t fileOid) {
  CBitVector bits;
  Calculate(catalog, bits);
  return bits.Get(fileOid);
}

// ---- Reference tests

bool CVXGroup::HasReference(uint32_t oid, unsigned refType) const {
  if (IsAll()) return false;
  auto fits = [refType](uint32_t type) {
    switch (refType) {
      case refCategory:
        return type == ttCategory;
      case refFolder:
        return type == ttFolder || type == ttRFolder;
      case refSelection:
        return type == ttSelection || type == ttPersSel;
      default:
        return false;
    }
  };
  return std::any_of(postfix_.begin(), postfix_.end(),
                     [&](const SExpr& e) { return e.Oid == oid && fits(e.Type); });
}

bool CVXGroup::HasGroupReference(const CVXCatalog& catalog, uint32_t oid) const {
  CBitVector onPath, done;
  return HasGroupReference_(catalog, oid, onPath, done);
}

// `onPath` holds the categories under examination: meeting one again means the contents loop,
// and a doubtful case counts as a reference. `done` holds those already answered false.
bool CVXGroup::HasGroupReference_(const CVXCatalog& catalog, uint32_t target, CBitVector& onPath,
                                  CBitVector& done) const {
  if (IsAll()) return false;
  if (onPath.Get(Oid())) return true;
  if (done.Get(Oid())) return false;
  std::vector<uint32_t> reach;
  catalog.GetGroupChildrenRecursive(Oid(), reach);
  auto holds = [&reach](uint32_t oid) {
    return std::find(reach.begin(), reach.end(), oid) != reach.end();
  };
  if (holds(target)) return true;
  if (holds(Oid())) return false;  // a damaged tree
  onPath.Set(Oid());
  bool found = false;
  for (const SExpr& e : postfix_) {
    if (e.Type != ttCategory) continue;
    if (e.Oid == target) found = true;
    if (!found) {
      catalog.GetGroupChildrenRecursive(e.Oid, reach);
      found = holds(target);
    }
    for (size_t i = 0; !found && i < reach.size(); ++i) {
      uint32_t oid = reach[i];
      if (oid == Oid() || oid == e.Oid) continue;
      auto it = catalog.Groups().find(oid);
      found = it == catalog.Groups().end() ||
              it->second.HasGroupReference_(catalog, target, onPath, done);
    }
    if (found) break;
  }
  onPath.Reset(Oid());
  if (!found) done.Set(Oid());
  return found;
}

bool CVXGroup::UpdateFolderReference(const CVXCatalog& catalog, uint32_t oldOid, uint32_t newOid) {
  if (IsAll()) return false;
  auto folder = catalog.Folders().find(newOid);
  if (folder == catalog.Folders().end()) return false;
  auto retarget = [&](SExpr& e) {
    if ((e.Type != ttFolder && e.Type != ttRFolder) || e.Oid != oldOid) return false;
    e.Oid = newOid;
    e.MediaID = folder->second.MediaID();
    e.MediaSerial = folder->second.MediaSerial();
    return true;
  };
  bool changed = false;
  for (SExpr& e : postfix_) {
    if ((changed = retarget(e))) break;
  }
  // Only the first reference changes in the postfix list, and then only a reference that opens
  // the infix list follows it. Stored formulas depend on this narrow reach.
  for (size_t i = 0; i < infix_.size() && !(changed && i > 0); ++i) retarget(infix_[i]);
  return changed;
}
