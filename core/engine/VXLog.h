#pragma once

// Logging shorthands for the core. The log is optional: every macro tests the pointer first.
// The source position is the caller's.

#include "QRLLogfile.h"

#define VX_LOG(log, level, text)                                                             \
  do {                                                                                       \
    if (CQRLLogfile* vx_l_ = (log)) vx_l_->AddInformal((text), (level), __LINE__, __FILE__); \
  } while (0)

#define VX_LOGF(log, level, format, ...)                                                    \
  do {                                                                                      \
    if (CQRLLogfile* vx_l_ = (log)) vx_l_->AddFormat((format), (level), 0, 0, __VA_ARGS__); \
  } while (0)

#define VX_WARN(log, text)                                                            \
  do {                                                                                \
    if (CQRLLogfile* vx_l_ = (log)) vx_l_->AddWarning((text), 1, __LINE__, __FILE__); \
  } while (0)

#define VX_ERROR(log, code, text)                                                        \
  do {                                                                                   \
    if (CQRLLogfile* vx_l_ = (log)) vx_l_->AddError((code), (text), __LINE__, __FILE__); \
  } while (0)

class CQRLLogfile;

// Turns the exception being handled into a result code and logs it: a CVXException* gives its
// own code (and is deleted), a std::exception 10003, anything else 10002. Call only from inside
// a catch block.
unsigned VXCodeOfCurrentException(CQRLLogfile* log, int line, const char* file);
