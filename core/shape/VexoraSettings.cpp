#include "VexoraSettings.h"
