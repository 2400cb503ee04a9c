// What the shared libraries export; everything else in them is hidden.
#pragma once

#define TALLY_API __attribute__((visibility("default")))
