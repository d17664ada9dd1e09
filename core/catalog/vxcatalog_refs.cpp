// Catalog operations that ask categories about their formulas: references, dependencies and
// calculated content.

#include <algorithm>

#include "VXGroupParser.h"
#include "vxcatalog_frame.h"
#include "xstring.h"

unsigned CVXCatalog::GetGroupReferrers(uint32_t oid, unsigned refType, std::vector<uint32_t>& out) {
  out.clear();
  if (!GetGroup(oid)) return VX_NOT_FOUND;
  for (const auto& [other, group] : groups_) {
    if (other == oid) continue;
    CVXGroup copy = group;
    if (copy.HasReference(oid, static_cast<ERefType>(refType))) out.push_back(other);
  }
  return VX_OK;
}

// True in `depends` when `otherOid` lies below `oid` or is named by the formula of `oid` or of
// anything below it.
unsigned CVXCatalog::GroupDependsOn(uint32_t oid, uint32_t otherOid, bool& depends) {
  depends = false;
  std::vector<uint32_t> below;
  if (unsigned rc = GetGroupChildrenRecursive(oid, below); rc != VX_OK) return rc;
  if (std::find(below.begin(), below.end(), otherOid) != below.end()) {
    depends = true;
    return VX_OK;
  }
  for (uint32_t child : below) {
    unsigned rc = GroupDependsOn(child, otherOid, depends);
    if (rc != VX_OK || depends) return rc;
  }
  if (const CVXGroup* group = GetGroup(oid)) {
    CVXGroup copy = *group;
    depends = copy.HasGroupReference(*this, otherOid);
  }
  return VX_OK;
}

unsigned CVXCatalog::GetGroupImages(uint32_t oid, std::vector<uint32_t>& out) {
  // Assignment, not the copy constructor: a category stored in error must stay refused.
  CVXGroup copy;
  if (LookupGroup(oid, copy) != VX_OK) return VX_NOT_FOUND;
  return copy.Calculate(*this, out);
}

// The files that no top-level category holds, by formula or by hand. A formula that names
// "@Unassigned" comes back here; the guard answers it with 15014 instead of recursing.
unsigned CVXCatalog::GetUnassignedImages(CBitVector& bits) {
  bits.Clear();
  if (inUnassignedCalc_) return VX_FORMULA_CIRCULAR;
  inUnassignedCalc_ = true;
  unsigned rc = VX_OK;
  CBitVector assigned;
  CBitVector work;
  for (const auto& [oid, group] : groups_) {
    CVXGroup copy = group;
    if (copy.Parent() != 0 || oid == VX_ALL_GROUP_OID || copy.IsFTIRoot() ||
        copy.Expression(*this).find("@Unassigned") != std::string::npos) {
      continue;
    }
    uint32_t flags = copy.Flags();
    copy.Flags() &= ~uint32_t{gfNoChildImages};
    unsigned r = copy.Calculate(*this, work);
    copy.Flags() = flags;
    if (r == VX_OK) {
      assigned |= work;
    } else if (r != VX_FORMULA_CIRCULAR) {
      std::string text = "Failed to parse category " + copy.Name() + " with error " +
                         std::to_string(static_cast<unsigned long>(r));
      VX_ERROR(Log_(), r, text.c_str());
      rc = r;
      break;
    }
  }
  if (rc == VX_OK) {
    GetFiles(work);
    if (!assigned.IsEmpty()) work.AndNot(assigned);
    bits = work;
  }
  inUnassignedCalc_ = false;
  return rc;
}

unsigned CVXCatalog::MoveFolderReferences(uint32_t oldOid, uint32_t newOid) {
  unsigned rc = VX_OK;
  for (auto& [oid, group] : groups_) {
    if (!group.UpdateFolderReference(*this, oldOid, newOid)) continue;
    CVXGroup copy = group;
    if ((rc = UpdateGroup(copy)) != VX_OK) {
      VX_ERROR(Log_(), rc, "CVXCatalog::MoveFolderReferences");
      break;
    }
  }
  return rc;
}

unsigned CVXCatalog::InvalidateDynamicGroups(uint32_t oid, const char* tag) {
  const std::string wanted = tag ? _mbsupr(std::string(tag)) : std::string();
  for (auto& [goid, group] : groups_) {
    if (!group.IsFTI() || group.NeedsRecalc() || (oid != 0 && goid != oid)) continue;
    if (tag && _mbsupr(group.FTITag()).find(wanted) == std::string::npos) continue;
    group.Flags() |= gfNeedsRecalc;
    CVXGroup copy = group;
    UpdateGroup(copy);
  }
  return VX_OK;
}

unsigned CVXCatalog::UpdateDynamicGroups(uint32_t oid, bool force, bool recalcChildren) {
  std::vector<uint32_t> roots;
  for (auto& [goid, group] : groups_) {
    if ((oid != 0 && goid != oid) || !group.IsFTI()) continue;
    if (group.IsFTIRoot()) {
      if (force || group.NeedsRecalc()) roots.push_back(goid);
    } else if (group.IsFTIChild() && force && !group.NeedsRecalc()) {
      group.Flags() |= gfNeedsRecalc;
      CVXGroup copy = group;
      UpdateGroup(copy);
    }
  }
  for (uint32_t root : roots) {
    if (unsigned rc = BuildDynamicChildren_(root, force, recalcChildren); rc != VX_OK) return rc;
  }
  return VX_OK;
}

// The build queries the full-text index for the root's tag values; a build without that code
// refuses rather than leave the root looking current.
unsigned CVXCatalog::BuildDynamicChildren_(uint32_t /*rootOid*/, bool /*force*/,
                                           bool /*recalcChildren*/) {
  VX_ERROR(Log_(), VX_NOT_FOUND, "Data-driven categories cannot be built by this build");
  return VX_NOT_FOUND;
}

unsigned CVXCatalog::ClearDynamicGroup(uint32_t oid) {
  CVXGroup copy;
  if (LookupGroup(oid, copy) != VX_OK) return VX_NOT_FOUND;
  copy.FTIPattern().clear();
  copy.FTITag().clear();
  copy.FTIType() = 0;
  copy.Images().Clear();
  unsigned rc = UpdateGroup(copy);
  if (rc != VX_OK) return rc;
  for (uint32_t child : copy.Children()) {
    CVXGroup c;
    if (LookupGroup(child, c) != VX_OK) return VX_NOT_FOUND;
    if (c.IsFTIChild() && (rc = RemoveGroup(child)) != VX_OK) return rc;
  }
  return rc;
}
