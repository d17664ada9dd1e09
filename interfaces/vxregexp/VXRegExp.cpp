#include "VXRegExp.h"

#include <re2/re2.h>

struct CVXRegExp::Impl {
  Impl(const std::string& pattern, const RE2::Options& options) : re(pattern, options) {}
  RE2 re;
};

CVXRegExp::CVXRegExp() = default;
CVXRegExp::CVXRegExp(const CVXRegExp& other) = default;
CVXRegExp& CVXRegExp::operator=(const CVXRegExp& other) = default;
CVXRegExp::~CVXRegExp() = default;

CVXRegExp::EResult CVXRegExp::SetPattern(const std::string& pattern, std::string* errorText,
                                         bool caseless) {
  RE2::Options options;
  options.set_encoding(RE2::Options::EncodingUTF8);
  options.set_case_sensitive(!caseless);
  options.set_log_errors(false);
  auto impl = std::make_shared<const Impl>(pattern, options);
  if (!impl->re.ok()) {
    impl_.reset();
    if (errorText) *errorText = impl->re.error();
    return reError;
  }
  impl_ = std::move(impl);
  return rePatternOK;
}

CVXRegExp::EResult CVXRegExp::Match(const std::string& text, std::string* errorText) const {
  if (!impl_) {
    if (errorText) *errorText = "no pattern set";
    return reNoPattern;
  }
  return RE2::PartialMatch(text, impl_->re) ? reMatch : reNoMatch;
}

std::string CVXRegExp::GetPattern() const { return impl_ ? impl_->re.pattern() : std::string(); }

bool CVXRegExp::IsCaseless() const { return impl_ && !impl_->re.options().case_sensitive(); }
