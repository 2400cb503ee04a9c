// HwReport: the statistics channels that drivers publish, as one include.
#pragma once

#include "hwreport/channel.h"
#include "hwreport/channels.h"
#include "hwreport/descriptions.h"
#include "hwreport/device_root.h"
#include "hwreport/error.h"
#include "hwreport/samples.h"
#include "hwreport/values.h"
