# shellcheck shell=bash disable=SC2034
# What building and testing needs beside a minimal Debian 12. Sourced by ./run and ./test, which set -euo pipefail.
#
#   install_packages "${build_packages[@]}"     installs those that are missing; asks the network only then
#   try_install_packages "${fuzz_packages[@]}"  the same, and answers false in place of ending the script

build_packages=(
  g++ cmake ninja-build pkg-config git
  libssl-dev libsqlite3-dev libcli11-dev libfmt-dev nlohmann-json3-dev
  openssl
)

test_packages=(
  libgtest-dev libgmock-dev googletest libbenchmark-dev
  clang-format clang-tidy python3
  man-db mandoc zsh fish lintian dpkg-dev file systemd
)

# Without these the fuzzing step is skipped, and says so.
fuzz_packages=(clang libclang-rt-14-dev)

# For the preset `arm`, beside what tools/arm-sysroot unpacks into the build's own folder.
arm_packages=(g++-arm-linux-gnueabihf qemu-user-static googletest)

# Prints those of the named packages that are not installed, one a line.
missing_packages() {
  local package
  for package in "$@"; do
    if [[ "$(dpkg-query -W -f '${db:Status-Status}' "$package" 2>/dev/null || true)" != installed ]]; then
      printf '%s\n' "$package"
    fi
  done
}

# Runs a command as root.
as_root() {
  if [[ "$(id -u)" == 0 ]]; then
    "$@"
  else
    sudo -- "$@"
  fi
}

can_be_root() {
  [[ "$(id -u)" == 0 ]] || command -v sudo >/dev/null
}

apt_get() {
  as_root env DEBIAN_FRONTEND=noninteractive apt-get -qq -o Dpkg::Use-Pty=0 "$@"
}

# The package lists are fetched once, however often packages are installed.
package_lists_are_fresh=false

try_install_packages() {
  local missing
  read -ra missing <<<"$(missing_packages "$@" | tr '\n' ' ')"
  if [[ ${#missing[@]} == 0 ]]; then
    return 0
  fi
  if ! command -v apt-get >/dev/null; then
    printf 'Not a Debian system. Install these yourself: %s\n' "${missing[*]}" >&2
    return 1
  fi
  if ! can_be_root; then
    printf 'Packages are missing, and there is no sudo. As root, run:\n  apt-get install --no-install-recommends %s\n' \
      "${missing[*]}" >&2
    return 1
  fi
  printf 'Installing: %s\n' "${missing[*]}"
  if [[ $package_lists_are_fresh == false ]]; then
    apt_get update || return 1
    package_lists_are_fresh=true
  fi
  # A package manager talks a lot; only when it fails is that worth reading.
  local log
  log=$(mktemp)
  if apt_get install --no-install-recommends -y "${missing[@]}" >"$log" 2>&1; then
    rm -f "$log"
    return 0
  fi
  cat "$log" >&2
  rm -f "$log"
  return 1
}

install_packages() {
  if ! try_install_packages "$@"; then
    printf 'Nothing was built.\n' >&2
    exit 1
  fi
}

# run_quietly WHAT COMMAND…: runs a command and shows what it printed only when it fails.
run_quietly() {
  local what=$1 log
  shift
  log=$(mktemp)
  if ! "$@" >"$log" 2>&1; then
    cat "$log" >&2
    rm -f "$log"
    printf '%s failed: %s\n' "$what" "$*" >&2
    exit 1
  fi
  rm -f "$log"
}
