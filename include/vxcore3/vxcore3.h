#pragma once

// The umbrella header of vxcore3: everything a host program needs.
#include "VXBase.h"
#include "VXResult.h"
#include "VXException.h"
#include "QRLLogfile.h"
#include "VXFile.h"
#include "VXMemFile.h"
#include "bitvector.h"
