#pragma once

#include <cstdint>
#include <string>

#include "VXBase.h"

// Location of a file or folder, always in URI form with "/" separators: "c:\pics\a.jpg" is kept
// as "file://c:/pics/a.jpg", "/photos/a.jpg" as "file:///photos/a.jpg". A native path is made
// only on demand. Every comparison of locations goes through this class and is case-insensitive
// on the stored text.
//
// Invariants after Set: no backslash remains; a text that held a slash carries a protocol; a
// folder set from a non-empty text ends in "/".
class CVXURI : public CVXBase {
 public:
  // Persisted inside folder records as a 32-bit value; a record may hold any value, which then
  // behaves as Other.
  enum EType : uint32_t { File = 0, Ftp = 1, Http = 2, Other = 3 };

  CVXURI() = default;
  CVXURI(const std::string& text, bool isFolder) { Set(text, isFolder); }
  CVXURI(const char* text, bool isFolder) { Set(text ? text : "", isFolder); }
  CVXURI(const CVXURI&) = default;
  CVXURI& operator=(const CVXURI&) = default;
  ~CVXURI() override = default;

  void Set(const std::string& text, bool isFolder);
  // A location as a record stored it: text, flag and type taken as they are, not normalised
  // again, so that a read gives back exactly what was written.
  static CVXURI Restore(std::string text, bool isFolder, uint32_t type);

  // The stored text, protocol included.
  const std::string& AsString() const { return text_; }
  std::string NoProtocol() const { return StripProtocol(text_); }
  // The text behind the protocol with backslashes, "c:\pics\a.jpg".
  std::string WindowsPath() const { return MakeWindowsPath(NoProtocol()); }
  // The folder part, ending in "/" unless empty.
  std::string URIPath() const;
  bool IsFolder() const { return isFolder_; }
  EType Type() const { return type_; }

  // "c:" for a drive, "//server/share" for a share, the host of ftp and http; else empty.
  std::string Server() const;
  // The directory below the drive or host, ending in "/" unless empty.
  std::string Path() const;
  // Name behind the last "/"; empty for a folder.
  std::string FileName() const;
  // Name and extension (with its dot) of the text's last "."; see the .cpp for how a name
  // without an extension falls back to the whole text.
  std::string NamePart() const;
  std::string ExtPart() const;
  // Last component of a folder; a drive root gives "c:/". Empty for a file.
  std::string LastName() const;
  // Probes the file system with the stored text, protocol included, as a search pattern.
  bool IsLocal() const;

  // A folder never equals a file. Across folder and file operator< is true both ways, so it is
  // no strict ordering there; never sort a mix of the two with it.
  bool operator==(const CVXURI& other) const;
  bool operator<(const CVXURI& other) const;
  bool operator<(const std::string& text) const;

  // The part behind the first "://"; the whole text when there is none.
  static std::string StripProtocol(const std::string& text);
  // Drops one trailing "/" or "\" from a text of at least 4 bytes, so "c:/" keeps its slash.
  static std::string StripTrailer(const std::string& text);
  // Every "/" behind the protocol (or from the start, if none) becomes a backslash.
  static std::string MakeWindowsPath(const std::string& text);

 protected:
  static int CompareNames(const std::string& a, const std::string& b);
  static EType TypeFromURI(const std::string& text);
  static std::string PathFromURI(const std::string& text, bool isFolder);
  // isFolder does not change the result; it is there for symmetry with PathFromURI.
  static std::string Normalize(const std::string& text, bool isFolder);

 private:
  friend class CVXFolder;  // restores text, flag and type from a record without Set

  std::string text_;
  bool isFolder_ = false;
  EType type_ = File;
};
