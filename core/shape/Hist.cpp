#include "Hist.h"
