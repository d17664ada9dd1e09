#include "VXLog.h"

#include <exception>

#include "VXException.h"
#include "VXResult.h"

unsigned VXCodeOfCurrentException(CQRLLogfile* log, int line, const char* file) {
  try {
    throw;
  } catch (CVXException* e) {
    unsigned code = e ? e->GetCode() : VX_UNKNOWN_EXCEPTION;
    if (log) log->AddError(e, line, file);
    delete e;
    return code;
  } catch (const std::exception& e) {
    if (log) log->AddError(e, line, file);
    return VX_FRAMEWORK_EXCEPTION;
  } catch (...) {
    if (log) log->AddError("...", line, file);
    return VX_UNKNOWN_EXCEPTION;
  }
}
