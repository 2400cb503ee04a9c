// The days of the analytics service.
#pragma once

namespace tally {

// True when today's figures belong to the analytics service: half of all devices send on any one
// day, each of them on every other day.
bool isAnalyticsDay();

}  // namespace tally
