#include "VolumeTable.h"

#include <sys/statvfs.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>

namespace vxhost {
namespace {

namespace fs = std::filesystem;

int DigitValue(char c, int base) {
  int v = c >= '0' && c <= '9'   ? c - '0'
          : c >= 'a' && c <= 'f' ? c - 'a' + 10
          : c >= 'A' && c <= 'F' ? c - 'A' + 10
                                 : 99;
  return v < base ? v : -1;
}

// Replaces "\" + lead + digits escapes: the mount table's "\ooo" (lead empty, base 8, three
// digits) and udev's "\xHH" (lead "x", base 16, two digits). Anything else stays as it is.
std::string DecodeEscapes(std::string_view text, std::string_view lead, int base, size_t digits) {
  std::string out;
  for (size_t i = 0; i < text.size(); ++i) {
    size_t first = i + 1 + lead.size();
    int value = -1;
    if (text[i] == '\\' && first + digits <= text.size() &&
        text.substr(i + 1, lead.size()) == lead) {
      value = 0;
      for (size_t d = 0; d < digits && value >= 0; ++d) {
        int v = DigitValue(text[first + d], base);
        value = v < 0 ? -1 : value * base + v;
      }
    }
    if (value < 0 || value > 255) {
      out += text[i];
      continue;
    }
    out += static_cast<char>(value);
    i = first + digits - 1;
  }
  return out;
}

std::string DecodeMountField(std::string_view field) { return DecodeEscapes(field, "", 8, 3); }

// Whether `mount` is `path` or one of its leading whole components.
bool IsMountOf(std::string_view mount, std::string_view path) {
  if (!path.starts_with(mount)) return false;
  return mount.size() == path.size() || mount.ends_with('/') || path[mount.size()] == '/';
}

std::string CanonicalOrSelf(const std::string& path) {
  std::error_code ec;
  fs::path c = fs::canonical(path, ec);
  return ec ? path : c.string();
}

std::string ReadAll(const std::string& path) {
  std::ifstream in(path);
  return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

}  // namespace

VolumeTable::VolumeTable() : mounts_(ParseMounts(ReadAll("/proc/self/mounts"))) {
  ReadLabels("/dev/disk/by-label");
}

VolumeTable::VolumeTable(std::string_view mountsText, const std::string& labelDir)
    : mounts_(ParseMounts(mountsText)) {
  ReadLabels(labelDir);
}

std::vector<MountEntry> VolumeTable::ParseMounts(std::string_view text) {
  std::vector<MountEntry> out;
  std::istringstream lines{std::string(text)};
  std::string line;
  while (std::getline(lines, line)) {
    std::istringstream fields(line);
    std::string device, point, type;
    if (!(fields >> device >> point >> type)) continue;
    out.push_back({DecodeMountField(device), DecodeMountField(point), DecodeMountField(type)});
  }
  return out;
}

std::string VolumeTable::DecodeLabel(std::string_view name) {
  return DecodeEscapes(name, "x", 16, 2);
}

void VolumeTable::ReadLabels(const std::string& labelDir) {
  std::error_code ec;
  for (fs::directory_iterator it(labelDir, ec), end; !ec && it != end; it.increment(ec)) {
    fs::path target = fs::canonical(it->path(), ec);
    if (ec) {
      ec.clear();
      continue;
    }
    labels_[target.string()] = DecodeLabel(it->path().filename().string());
  }
}

const MountEntry* VolumeTable::FindMount(std::string_view path) const {
  const MountEntry* best = nullptr;
  for (const auto& m : mounts_) {
    if (IsMountOf(m.mountPoint, path) &&
        (!best || m.mountPoint.size() >= best->mountPoint.size())) {
      best = &m;
    }
  }
  return best;
}

VolumeIdentity VolumeTable::Identify(const std::string& path) const {
  VolumeIdentity id;
  id.mountPoint = "/";
  if (const MountEntry* m = FindMount(path)) {
    id.mountPoint = m->mountPoint;
    id.device = m->device;
  }
  auto label =
      id.device.starts_with('/') ? labels_.find(CanonicalOrSelf(id.device)) : labels_.end();
  id.mediaId = label != labels_.end() ? label->second : id.mountPoint;
  struct statvfs st;
  if (::statvfs(path.c_str(), &st) == 0) {
    // Two 32-bit halves folded, so that the text parses as one 32-bit serial.
    uint64_t fsid = st.f_fsid;
    char text[16];
    std::snprintf(text, sizeof text, "0x%08X", static_cast<uint32_t>(fsid ^ (fsid >> 32)));
    id.mediaSerial = text;
  }
  return id;
}

}  // namespace vxhost
