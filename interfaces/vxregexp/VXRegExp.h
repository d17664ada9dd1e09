#pragma once

#include <memory>
#include <string>

#include "VXBase.h"

// A regular expression in RE2 syntax over UTF-8 text. Matching runs in time linear in the text,
// so no pattern a user types can hang a caller. A compiled pattern is immutable and shared by
// copies; Match may be called on one object from many threads.
class CVXRegExp : public CVXBase {
 public:
  enum EResult {
    reMatch = 0,      // Match: the text matches
    reNoMatch = 1,    // Match: it does not
    reError = 2,      // SetPattern: the pattern was refused (errorText says why)
    rePatternOK = 3,  // SetPattern: the pattern was accepted
    reNoPattern = 4,  // Match: no pattern is set
  };

  CVXRegExp();
  CVXRegExp(const CVXRegExp& other);
  CVXRegExp& operator=(const CVXRegExp& other);
  ~CVXRegExp() override;

  // Compiles `pattern`; `caseless` ignores case by Unicode simple case folding. A refused
  // pattern (bad syntax, invalid UTF-8, too large to compile) gives reError with RE2's text in
  // errorText and leaves no pattern set. The empty pattern is accepted and matches every text.
  EResult SetPattern(const std::string& pattern, std::string* errorText = nullptr,
                     bool caseless = false);
  // reMatch if the pattern matches anywhere in `text`, reNoMatch if not; reNoPattern (with a
  // text) when none is set. errorText is left alone otherwise.
  EResult Match(const std::string& text, std::string* errorText = nullptr) const;
  // The pattern last accepted; empty when none is set.
  std::string GetPattern() const;
  bool IsCaseless() const;

 private:
  struct Impl;
  std::shared_ptr<const Impl> impl_;
};
