#include "VXSelector.h"

#include <cstring>
#include <utility>

#include "VXException.h"
#include "VXFile.h"
#include "VXSelCoreData.h"
#include "VXSelFeatures.h"
#include "xstring.h"

namespace {

constexpr uint16_t kObjectVersion = 1;
constexpr uint16_t kSelectorVersion = 1;

bool Contains(const std::string& key, const char* part) {
  return key.find(part) != std::string::npos;
}

// An empty blob may have no buffer at all, so memcmp is not called for it.
bool SameBlob(const CVXMemFile& a, const CVXMemFile& b) {
  size_t size = static_cast<size_t>(a.GetFileSize());
  return size == b.GetFileSize() &&
         (size == 0 || std::memcmp(a.GetBuffer(), b.GetBuffer(), size) == 0);
}

}  // namespace

void CVXSelector::Clear() {
  data_.NeedsOriginals = false;
  data_.Features.clear();
}

bool CVXSelector::SetFeature(const std::string& key, const CVXMemFile& blob) {
  data_.Features.insert_or_assign(key, blob);
  return true;
}

bool CVXSelector::GetFeature(const std::string& key, CVXMemFile& out) const {
  auto it = data_.Features.find(key);
  if (it == data_.Features.end()) return false;
  out = it->second;
  out.Rewind();
  return true;
}

bool CVXSelector::LoadFeature_(const CVXMemFile& blob, SSelCoreData& record) {
  CVXMemFile scratch(blob.GetBuffer(), static_cast<size_t>(blob.GetFileSize()));
  try {
    record.Load(&scratch, true);
  } catch (CVXException* e) {
    delete e;
    return false;
  }
  return true;
}

template <typename Test>
bool CVXSelector::AnyCore_(const char* part, Test test) const {
  for (const auto& [key, blob] : data_.Features) {
    SSelCoreData core;
    if (Contains(key, part) && LoadFeature_(blob, core) && test(core)) return true;
  }
  return false;
}

const CVXMemFile* CVXSelector::FirstContaining_(const char* part) const {
  for (const auto& [key, blob] : data_.Features) {
    if (Contains(key, part)) return &blob;
  }
  return nullptr;
}

bool CVXSelector::HasSelectorForKey(const std::string& key) const {
  auto it = data_.Features.find(key);
  SSelCoreData core;
  return it != data_.Features.end() && LoadFeature_(it->second, core) && core.Active;
}

bool CVXSelector::HasPropertySelector() const {
  return AnyCore_("VXSELProperties", [](const SSelCoreData& c) { return c.Active; });
}

bool CVXSelector::HasActiveMask() const {
  return AnyCore_("VXSELMask", [](const SSelCoreData& c) { return c.Active && c.InterActive; });
}

bool CVXSelector::NeedsVXShapeData() const {
  return HasSelectorForKey("VXSELColor") || HasSelectorForKey("VXSELMatch");
}

bool CVXSelector::IsInterActive() const {
  return AnyCore_("", [](const SSelCoreData& c) { return c.Active && c.InterActive; });
}

bool CVXSelector::WorksWithActiveFolder() const {
  const CVXMemFile* blob = FirstContaining_("VXSELFolders");
  SSelFolders folders;
  folders.Reset();
  return blob && LoadFeature_(*blob, folders) && folders.Active && folders.Mode == 0;
}

bool CVXSelector::WorksWithActiveCategory() const {
  const CVXMemFile* blob = FirstContaining_("VXSELCategories");
  SSelCategories categories;
  categories.Reset();
  return blob && LoadFeature_(*blob, categories) && categories.Active && categories.Mode == 2;
}

bool CVXSelector::operator==(const CVXSelector& other) const {
  const SData& a = data_;
  const SData& b = other.data_;
  if (Oid() != other.Oid() || xstring_comparenocase(a.Name, b.Name) != 0 ||
      a.NeedsOriginals != b.NeedsOriginals || a.Features.size() != b.Features.size() ||
      IsInterActive() != other.IsInterActive()) {
    return false;
  }
  for (const auto& [key, blob] : a.Features) {
    auto it = b.Features.find(key);
    if (it == b.Features.end() || !SameBlob(blob, it->second)) return false;
  }
  return true;
}

CVXFile& operator<<(CVXFile& file, const CVXSelector& selector) {
  const CVXSelector::SData& d = selector.Properties();
  file << kObjectVersion << selector.Oid() << kSelectorVersion << d.Name
       << uint8_t{d.NeedsOriginals} << static_cast<uint32_t>(d.Features.size());
  for (const auto& [key, blob] : d.Features) file << key << blob;
  return file;
}

// Reads into a copy, so that a short stream leaves `selector` as it was.
CVXFile& operator>>(CVXFile& file, CVXSelector& selector) {
  CVXSelector r(selector);
  CVXSelector::SData& d = r.Properties();
  uint16_t objectVersion = 0, version = 0;
  uint8_t needsOriginals = 0;
  uint32_t count = 0;
  file >> objectVersion >> r.Oid() >> version >> d.Name >> needsOriginals >> count;
  d.Features.clear();
  // Each feature takes bytes of the stream, so a corrupt count ends at its end.
  for (uint32_t i = 0; i < count; ++i) {
    std::string key;
    CVXMemFile blob;
    file >> key >> blob;
    d.Features.insert_or_assign(std::move(key), std::move(blob));
  }
  d.NeedsOriginals =
      needsOriginals != 0 || r.AnyCore_("", [](const SSelCoreData& c) { return c.NeedsOriginals; });
  selector = r;
  return file;
}
