# The Debian packages: component of the install rules, name, section, what it depends on beside the
# libraries that it is linked with, description. A component without install rules in this build is
# left out. @VERSION@ is the version of the packages, @USER@ what makes the user and its directories.
set(TALLYRUN_USER_TOOLS "systemd | systemd-standalone-sysusers | systemd-sysusers, \
systemd | systemd-standalone-tmpfiles | systemd-tmpfiles")
set(TALLYRUN_PACKAGES
  "tallyrun|tallyrun|admin|@USER@|once-a-day analytics job, recorder of metrics and operator's tool"
  "tallykv|libtallykv0|libs||property values of the telemetry libraries"
  "tallykv-dev|libtallykv-dev|libdevel|libtallykv0 (= @VERSION@)|property values of the telemetry libraries, development files"
  "hwreport|libhwreport0|libs|libtallykv0 (= @VERSION@)|statistics channels of drivers"
  "hwreport-dev|libhwreport-dev|libdevel|libhwreport0 (= @VERSION@), libtallykv-dev (= @VERSION@)|statistics channels of drivers, development files"
  "tallystorage|libtallystorage0|libs|libtallykv0 (= @VERSION@)|flash-storage telemetry"
  "tallystorage-dev|libtallystorage-dev|libdevel|libtallystorage0 (= @VERSION@), libtallykv-dev (= @VERSION@)|flash-storage telemetry, development files"
  "tallyclient|libtallyclient0|libs||metrics of programs for the daily log"
  "tallyclient-dev|libtallyclient-dev|libdevel|libtallyclient0 (= @VERSION@)|metrics of programs for the daily log, development files")
set(TALLYRUN_LONG_DESCRIPTION
"Part of the daily job of a device: whitelisted counters and statistics of
the day that has ended become one log, the state of the storage is
recorded, and scheduled changes of preferences are applied. Nothing that
the whitelist does not name reaches a log.")
