#pragma once

#include <string>
#include <vector>

// Comparisons of file names for the selection's name check. They are pure functions of their
// arguments; the selection worker's members of the same names forward to them.
namespace VXNameMatch {

// Difference of two names, extensions cut off, 0 for the same. Mismatches weigh more near the
// start, and a digit against a digit weighs a quarter, so that names differing in a counter
// are close. Extra characters of `b` cost twice what extra characters of `a` cost.
double SmartMatchFileName(const char* a, const char* b);

// 0 when the letters of `a` before its first "." occur, upper-cased, inside those of `b`;
// otherwise the smart difference of the full names.
double LooseMatchFileName(const char* a, const char* b);

// Word pattern: a word must occur in the name (extension cut, case ignored); "+word" is
// required, "-word" must not occur. Sets `score` to 100 on a match, else 0.
bool PatternMatchFileName(const char* pattern, const char* name, double& score);

// Splits at blanks, tabs, line ends, ",", "." and ";" outside double quotes; a doubled quote is
// one quote character. Empty words are dropped.
std::vector<std::string> SplitWords(const std::string& text);

// The name up to its last ".", or the whole name without one.
std::string CutExtension(const std::string& name);

}  // namespace VXNameMatch
