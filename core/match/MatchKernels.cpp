#include "MatchKernels.h"
