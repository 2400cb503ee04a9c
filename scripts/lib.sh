# Shared by the scripts; sourced, not run.
set -euo pipefail

root_dir=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
jobs=$(nproc)

# What the project is built with, for the processor that it is built for.
library_packages=(
  libplist-dev libsqlite3-dev libsystemd-dev libmd-dev libfmt-dev
  nlohmann-json3-dev libcli11-dev
  libgtest-dev libgmock-dev
)

# The compiler cache needs a folder that can be written, also where there is no home.
if [ -z "${CCACHE_DIR:-}" ] && ! [ -w "${HOME:-/nonexistent}" ]; then
  export CCACHE_DIR="$root_dir/build/ccache"
fi

# What tests use if it is installed: without it they are skipped, and say so.
optional_test_packages=(
  rustc gccgo curl
  netcat-openbsd socat python3-statsd python3-aiodogstatsd libnet-statsd-perl ruby-statsd npm
  chromium chromium-driver clickhouse-server clickhouse-client
)
# The same from npm, below build/npm-clients.
optional_npm_packages=(
  unix-dgram@2.0.7 hot-shots@17.1.1 node-statsd@0.1.1 axe-core@4.14.1 @duckdb/node-api@1.5.6-r.1
)

say() { printf '\n== %s\n' "$*"; }
fail() {
  printf '%s: %s\n' "$(basename "$0")" "$*" >&2
  exit 1
}

# as_root COMMAND...
as_root() {
  if [ "$(id -u)" -eq 0 ]; then
    "$@"
  else
    command -v sudo >/dev/null || fail "neither root nor sudo; run by hand: $*"
    sudo "$@"
  fi
}

# build_with PRESET [TARGET ...]: configures, then builds. Whoever has a compiler of its own must not
# fail on its warnings; .ci/run sets TALLYRUN_WARNINGS_ARE_ERRORS.
build_with() {
  local preset=$1
  shift
  cd "$root_dir"
  cmake --preset "$preset" "-DCMAKE_COMPILE_WARNING_AS_ERROR=${TALLYRUN_WARNINGS_ARE_ERRORS:-OFF}" \
    >"/tmp/tallyrun-configure.$$" 2>&1 ||
    { cat "/tmp/tallyrun-configure.$$" >&2; rm -f "/tmp/tallyrun-configure.$$"; fail "cannot configure"; }
  rm -f "/tmp/tallyrun-configure.$$"
  cmake --build "$(build_folder "$preset")" --parallel "$jobs" ${1:+--target "$@"}
}

build_folder() {
  case $1 in
    default) echo "$root_dir/build" ;;
    *) echo "$root_dir/build-$1" ;;
  esac
}
