// Category operations of the catalog: the tree of categories, the explicit order of siblings and
// the assignment of files, each change written through.

#include <algorithm>

#include "VXGroupParser.h"
#include "vxcatalog_frame.h"
#include "xstring.h"

namespace {

// Sort-item order of siblings: explicit places first decide when both have one, else the name,
// byte-wise with case.
struct SSortItem {
  uint32_t Oid;
  int32_t SortSequence;
  std::string Name;
};

bool SortItemLess(const SSortItem& a, const SSortItem& b) {
  if (a.SortSequence >= 0 && b.SortSequence >= 0 && a.SortSequence != b.SortSequence) {
    return a.SortSequence < b.SortSequence;
  }
  return a.Name < b.Name;
}

}  // namespace

CVXGroup* CVXCatalog::GetGroup(uint32_t oid) {
  auto it = groups_.find(oid);
  return it == groups_.end() ? nullptr : &it->second;
}

const CVXGroup* CVXCatalog::GetGroup(uint32_t oid) const {
  auto it = groups_.find(oid);
  return it == groups_.end() ? nullptr : &it->second;
}

unsigned CVXCatalog::LookupGroup(uint32_t oid, CVXGroup& out) const {
  const CVXGroup* group = GetGroup(oid);
  if (!group) return VX_NOT_FOUND;
  out = *group;
  return VX_OK;
}

uint32_t CVXCatalog::LookupGroup(const std::string& fullName) const {
  std::string name;
  for (const auto& entry : groups_) {
    if (GetFullGroupName(entry.first, name) == VX_OK && name == fullName) return entry.first;
  }
  return 0;
}

unsigned CVXCatalog::GetGroupSortInfo(uint32_t oid, int& sortSequence, std::string& name) const {
  const CVXGroup* group = GetGroup(oid);
  if (!group) return VX_NOT_FOUND;
  sortSequence = group->SortSequence();
  name = group->Name();
  return VX_OK;
}

// The walk up is bounded by the number of categories, so a damaged, cyclic parent chain ends.
unsigned CVXCatalog::GetFullGroupName(uint32_t oid, std::string& name) const {
  name.clear();
  const CVXGroup* group = GetGroup(oid);
  if (!group) return VX_NOT_FOUND;
  name = group->Name();
  uint32_t parent = group->Parent();
  for (size_t steps = 0; parent != 0; ++steps) {
    const CVXGroup* p = GetGroup(parent);
    if (!p || steps > groups_.size()) return VX_NOT_FOUND;
    name.insert(0, p->Name() + ".");
    parent = p->Parent();
  }
  return VX_OK;
}

unsigned CVXCatalog::GetGroups(std::vector<uint32_t>& out) const {
  out.clear();
  for (const auto& [oid, group] : groups_) {
    if (group.Parent() != 0) continue;
    out.push_back(oid);
    std::vector<uint32_t> below;
    GetGroupChildrenRecursive(oid, below);
    out.insert(out.end(), below.begin(), below.end());
  }
  return VX_OK;
}

// What `out` already holds counts as seen: a child met again gives 15014 and is not descended
// into, so a cycle in Children ends. The result is that of the last child looked at.
unsigned CVXCatalog::GetGroupChildrenRecursive(uint32_t oid, std::vector<uint32_t>& out) const {
  const CVXGroup* group = GetGroup(oid);
  if (!group) return VX_NOT_FOUND;
  const std::vector<uint32_t> children = group->Children();
  unsigned rc = VX_OK;
  for (uint32_t child : children) {
    if (std::find(out.begin(), out.end(), child) != out.end()) {
      rc = VX_FORMULA_CIRCULAR;
      continue;
    }
    out.push_back(child);
    if ((rc = GetGroupChildrenRecursive(child, out)) != VX_OK) break;
  }
  return rc;
}

unsigned CVXCatalog::_RecurseGroup(uint32_t oid, CBitVector& bits) {
  const CVXGroup* group = GetGroup(oid);
  if (!group) return VX_NOT_FOUND;
  std::vector<uint32_t> below;
  unsigned rc = GetGroupChildrenRecursive(oid, below);
  for (uint32_t child : below) bits.Set(child);
  return rc;
}

unsigned CVXCatalog::GetFileGroups(uint32_t fileOid, std::vector<uint32_t>& out) const {
  out.clear();
  for (const auto& [oid, group] : groups_) {
    if (fileOid < group.Images().Size() && group.Images().Get(fileOid)) out.push_back(oid);
  }
  return VX_OK;
}

unsigned CVXCatalog::GetFileGroups(const std::vector<uint32_t>& fileOids,
                                   std::vector<uint32_t>& out) const {
  out.clear();
  CBitVector files(std::vector<unsigned long>(fileOids.begin(), fileOids.end()));
  for (const auto& [oid, group] : groups_) {
    CBitVector both = group.Images();
    both &= files;
    if (!both.IsEmpty()) out.push_back(oid);
  }
  return VX_OK;
}

unsigned CVXCatalog::GetDynamicGroups(std::vector<uint32_t>& out) const {
  out.clear();
  for (const auto& [oid, group] : groups_) {
    if (group.IsFTIRoot()) out.push_back(oid);
  }
  return VX_OK;
}

// Persistent selection records are read by the selection code; a build without it knows none.
unsigned CVXCatalog::GetPersSelOid(const std::string& /*name*/, uint32_t& oid) {
  oid = 0;
  return VX_NOT_FOUND;
}

// ---- Changing categories

unsigned CVXCatalog::AddGroup(const CVXGroup& group) {
  if (group.Oid() == 0) return VX_NOT_FOUND;
  return Frame_("AddGroup", 3, &group.Name(), hAllLevels, [&]() -> unsigned {
    CVXGroup copy = group;
    if (copy.Parent() == VX_ALL_GROUP_OID) copy.Parent() = 0;
    uint32_t oid = copy.Oid();
    if (groups_.count(oid)) return VX_ALREADY_PRESENT;
    groups_.emplace(oid, copy);
    if (unsigned rc = StoreGroup(oid); rc != VX_OK) {
      groups_.erase(oid);
      return rc;
    }
    if (copy.Parent() == 0) return VX_OK;
    unsigned rc = VX_NOT_FOUND;
    if (const CVXGroup* parent = GetGroup(copy.Parent())) {
      CVXGroup p = *parent;
      rc = p.AddChild(oid);
      if (rc == VX_OK) rc = UpdateGroup(p);
    }
    if (rc != VX_OK) RemoveGroup(oid);
    return rc;
  });
}

unsigned CVXCatalog::UpdateGroup(const CVXGroup& group) {
  return Frame_("UpdateGroup", 3, &group.Name(), hNoHandlers, [&]() -> unsigned {
    // Calculation and the data-driven build update categories on read-only stores too.
    if (store_.IsReadOnly()) return VX_OK;
    CVXGroup* record = GetGroup(group.Oid());
    if (!record) return VX_NOT_FOUND;
    *record = group;
    return StoreGroup(group.Oid());
  });
}

// Exceptions pass: a failed removal of the record reaches the caller, with the category still
// in the map and already unlinked from its parent.
unsigned CVXCatalog::RemoveGroup(uint32_t oid) {
  return Frame_("RemoveGroup", 3, nullptr, hNoHandlers, [&]() -> unsigned {
    CVXGroup* record = GetGroup(oid);
    if (!record) return VX_NOT_FOUND;
    const std::vector<uint32_t> children = record->Children();
    for (uint32_t child : children) {
      if (unsigned rc = RemoveGroup(child); rc != VX_OK) {
        VX_ERROR(Log_(), rc, "RemoveGroup: child");
        StoreGroup(oid);
        return rc;
      }
    }
    record = GetGroup(oid);
    if (!record) {
      if (CQRLLogfile* log = Log_(); log && log->Level() > 3) VX_ERROR(log, 0, "ASSERT failed");
      return VX_NOT_FOUND;
    }
    if (uint32_t parentOid = record->Parent(); parentOid != 0) {
      if (CVXGroup* parent = GetGroup(parentOid)) {
        parent->RemoveChild(oid);
        StoreGroup(parentOid);
      }
    }
    if (unsigned rc = RemoveRecord_(rtGroup, oid); rc != VX_OK) VX_THROW(rc);
    groups_.erase(oid);
    return VX_OK;
  });
}

// Exceptions pass. The result is that of the last store: an assignment stored in the second
// walk reports success even after a failed removal in the first.
unsigned CVXCatalog::SetFileGroups(uint32_t fileOid, const std::vector<uint32_t>& groups,
                                   bool additive) {
  return Frame_("SetFileGroups", 3, nullptr, hNoHandlers, [&]() -> unsigned {
    unsigned rc = VX_OK;
    auto store = [&](uint32_t oid) {
      rc = StoreGroup(oid);
      if (rc != VX_OK) {
        VX_ERROR(Log_(), rc, "SetFileGroups");
        VX_WARN(Log_(), "Cannot update group!");
      }
    };
    if (!additive) {
      for (auto& [oid, group] : groups_) {
        if (fileOid >= group.Images().Size() || !group.Images().Get(fileOid)) continue;
        group.RemoveImage(fileOid);
        store(oid);
      }
    }
    for (uint32_t oid : groups) {
      CVXGroup* group = GetGroup(oid);
      if (!group) continue;
      group->AddImage(*this, fileOid);
      store(oid);
      rc = VX_OK;
    }
    return rc;
  });
}

// A category and everything below it, as bits; empty for 0 or when the subtree cannot be walked.
CBitVector CVXCatalog::GroupScope_(uint32_t parentOid) const {
  CBitVector scope;
  std::vector<uint32_t> below;
  if (parentOid != 0 && GetGroupChildrenRecursive(parentOid, below) == VX_OK) {
    for (uint32_t oid : below) scope.Set(oid);
    scope.Set(parentOid);
  }
  return scope;
}

unsigned CVXCatalog::RemoveImageFromGroups(uint32_t fileOid, uint32_t parentOid) {
  CBitVector scope = GroupScope_(parentOid);
  for (auto& [oid, group] : groups_) {
    bool inScope = parentOid == 0 || (oid < scope.Size() && scope.Get(oid));
    if (!inScope || fileOid >= group.Images().Size() || !group.Images().Get(fileOid)) continue;
    group.RemoveImage(fileOid);
    StoreGroup(oid);
  }
  return VX_OK;
}

// Changes memory only; nothing of the system calls it.
unsigned CVXCatalog::RemoveImageFromGroups(const std::vector<uint32_t>& fileOids,
                                           uint32_t parentOid) {
  CBitVector scope = GroupScope_(parentOid);
  for (auto& [oid, group] : groups_) {
    if (parentOid == 0 || (oid < scope.Size() && scope.Get(oid))) group.RemoveImage(fileOids);
  }
  return VX_OK;
}

// Gives `oid` an explicit place before or after `targetOid` among its siblings; with target 0
// it clears the explicit order of the family below `oid` ("@All": the top level).
unsigned CVXCatalog::ReorderGroup(uint32_t oid, uint32_t targetOid, bool before) {
  const CVXGroup* group = GetGroup(oid);
  if (!group) return VX_NOT_FOUND;
  auto sorted = [this](const std::vector<uint32_t>& oids) {
    std::vector<SSortItem> items;
    for (uint32_t o : oids) {
      if (const CVXGroup* g = GetGroup(o)) items.push_back({o, g->SortSequence(), g->Name()});
    }
    std::stable_sort(items.begin(), items.end(), SortItemLess);
    std::vector<uint32_t> out;
    out.reserve(items.size());
    for (const SSortItem& item : items) out.push_back(item.Oid);
    return out;
  };
  auto topLevel = [this]() {
    std::vector<uint32_t> top;
    for (const auto& [o, g] : groups_) {
      if (g.Parent() == 0 && o != VX_ALL_GROUP_OID) top.push_back(o);
    }
    return top;
  };
  std::vector<uint32_t> list;
  uint32_t parentOid = group->Parent();
  if (targetOid == 0) {
    list = sorted(oid == VX_ALL_GROUP_OID ? topLevel() : group->Children());
  } else {
    std::vector<uint32_t> siblings;
    if (parentOid != 0) {
      const CVXGroup* parent = GetGroup(parentOid);
      if (!parent) return VX_NOT_FOUND;
      siblings = sorted(parent->Children());
    } else {
      siblings = sorted(topLevel());
    }
    for (uint32_t s : siblings) {
      if (s == oid) continue;
      if (s == targetOid) {
        list.push_back(before ? oid : targetOid);
        list.push_back(before ? targetOid : oid);
      } else {
        list.push_back(s);
      }
    }
    if (list.size() != siblings.size()) return VX_NOT_FOUND;
  }
  unsigned rc = VX_OK;
  int32_t place = 0;
  for (uint32_t o : list) {
    CVXGroup* g = GetGroup(o);
    if (!g) continue;
    g->SortSequence() = targetOid != 0 ? place++ : -1;
    if ((rc = StoreGroup(o)) != VX_OK) break;
  }
  if (rc == VX_OK && targetOid != 0 && parentOid != 0) {
    if (CVXGroup* parent = GetGroup(parentOid)) {
      parent->Children() = list;
      rc = StoreGroup(parentOid);
    }
  }
  if (rc != VX_OK) VX_ERROR(Log_(), rc, "ReorderGroup");
  return rc;
}
