#pragma once

#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace vxhost {

struct MountEntry {
  std::string device;  // as the mount table names it, e.g. "/dev/sdb1" or "tmpfs"
  std::string mountPoint;
  std::string type;
};

// The volume a folder lies on, as catalog folder records keep it.
struct VolumeIdentity {
  std::string mountPoint;
  std::string device;
  std::string mediaId;      // the file system's label, else the mount point
  std::string mediaSerial;  // the file system id folded to 32 bits, "0x%08X"
};

// The mount table with the labels of the devices in it, read once. Lookups are by canonical
// path: the mount whose point is the longest whole-component prefix wins, the later of two
// mounts on one point (it hides the earlier).
class VolumeTable {
 public:
  // Reads /proc/self/mounts and the links in /dev/disk/by-label.
  VolumeTable();
  // From a mount table's text and a folder of label links (tests); a missing folder means no
  // labels.
  VolumeTable(std::string_view mountsText, const std::string& labelDir);

  // Lines "device mountpoint type options ...", with the kernel's octal escapes ("\040").
  static std::vector<MountEntry> ParseMounts(std::string_view text);
  // udev's link names escape bytes as "\xHH".
  static std::string DecodeLabel(std::string_view linkName);

  const MountEntry* FindMount(std::string_view canonicalPath) const;
  // The identity of the volume holding `canonicalPath`; the serial comes from statvfs of the
  // path itself. Without a matching mount the mount point is "/".
  VolumeIdentity Identify(const std::string& canonicalPath) const;

  const std::vector<MountEntry>& mounts() const { return mounts_; }

 private:
  void ReadLabels(const std::string& labelDir);

  std::vector<MountEntry> mounts_;
  std::map<std::string, std::string> labels_;  // canonical device path -> label
};

}  // namespace vxhost
