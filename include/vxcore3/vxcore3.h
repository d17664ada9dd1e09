#pragma once

// The umbrella header of vxcore3: everything a host program needs.
#include "VXBase.h"
#include "VXResult.h"
#include "VXException.h"
#include "QRLLogfile.h"
#include "VXFile.h"
#include "VXMemFile.h"
#include "bitvector.h"
#include "VXFileSystem.h"
#include "xstring.h"
#include "QRLBlobDB.h"
#include "VXDBObject.h"
#include "VXGroup.h"
#include "vxcatalog.h"
#include "SelTempStore.h"
#include "VXEngineTypes.h"
#include "VXEngine.h"
