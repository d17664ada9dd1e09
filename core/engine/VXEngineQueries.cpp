#include "VXEngine.h"
