// Storage figures beside the driver's statistics, all at once.
#pragma once

#include "storage/freezer.h"
#include "storage/health.h"
#include "storage/kcdata.h"
#include "storage/reclaim.h"
