# shellcheck shell=bash
# The Debian packages that the project is built and tested with, and how they get installed. Sourced by the scripts.

# shellcheck disable=SC2034  # The scripts that source this file use the lists.
BUILD_PACKAGES=(
  build-essential g++ cmake ninja-build ccache mold pkg-config
  libsystemd-dev libasio-dev libcurl4-openssl-dev libssl-dev zlib1g-dev libplist-dev libexpat1-dev libicu-dev libseccomp-dev
  rapidjson-dev libfmt-dev libcli11-dev libcpp-httplib-dev libbrotli-dev
  libgtest-dev libgmock-dev libbenchmark-dev
)

# What the daemon needs to run: systemd brings the tool that gives a machine its ID.
# shellcheck disable=SC2034  # As above.
RUN_PACKAGES=(systemd ca-certificates tzdata)

# Programs and data that the tests run: a web server, a browser with a font, D-Bus clients, what looks at libraries and makes
# packages, certificates, time zones.
# shellcheck disable=SC2034  # As above.
TEST_PACKAGES=(
  nginx-light chromium-headless-shell fonts-dejavu-core libglib2.0-bin systemd python3 python3-dbus binutils dpkg-dev fakeroot
  file bash-completion shellcheck groff-base man-db openssl curl procps ca-certificates tzdata
)

# The compiler with the fuzzing engine, and its sanitizers' runtime libraries.
# shellcheck disable=SC2034  # As above.
FUZZ_PACKAGES=(clang-14 libclang-rt-14-dev)

die() {
  printf '%s: %s\n' "$(basename "$0")" "$*" >&2
  exit 1
}

say() {
  printf '== %s\n' "$*"
}

as_root() {
  if [[ $(id -u) -eq 0 ]]; then
    "$@"
  else
    sudo "$@"
  fi
}

is_installed() {
  [[ $(dpkg-query -W -f '${db:Status-Status}' "$1" 2>/dev/null) == installed ]]
}

has_candidate() {
  apt-cache show --no-all-versions "$1" >/dev/null 2>&1
}

apt_install() {
  as_root env DEBIAN_FRONTEND=noninteractive apt-get -y -o DPkg::Lock::Timeout=300 --no-install-recommends install "$@"
}

# Packages such as the web server start their service when they are installed, unless this file says no.
POLICY_FILE=/usr/sbin/policy-rc.d

forbid_services() {
  [[ -e $POLICY_FILE ]] && return
  printf '#!/bin/sh\nexit 101\n' | as_root tee "$POLICY_FILE" >/dev/null
  as_root chmod 755 "$POLICY_FILE"
  trap 'as_root rm -f "$POLICY_FILE"' EXIT
}

allow_services() {
  [[ $(trap -p EXIT) == *POLICY_FILE* ]] || return 0
  as_root rm -f "$POLICY_FILE"
  trap - EXIT
}

# install_packages NAME...: installs those that are missing; does nothing, and needs no rights, when none is.
install_packages() {
  if ! command -v dpkg-query >/dev/null || ! command -v apt-get >/dev/null; then
    die "packages can only be installed on Debian (there is no apt-get); these are needed: $*"
  fi

  local package missing=() updated=no
  for package in "$@"; do
    is_installed "$package" || missing+=("$package")
  done
  [[ ${#missing[@]} -eq 0 ]] && return

  if [[ $(id -u) -ne 0 ]] && ! sudo -v; then
    die "these packages must be installed by root, and sudo does not let you: ${missing[*]}"
  fi

  say "Installing ${missing[*]}"
  for package in "${missing[@]}"; do
    if ! has_candidate "$package"; then
      as_root apt-get update || die "the package lists can't be fetched (apt-get update)"
      updated=yes
      break
    fi
  done

  forbid_services
  if ! apt_install "${missing[@]}"; then
    # Lists that are too old name files that the archive no longer has.
    if [[ $updated == yes ]] || ! as_root apt-get update || ! apt_install "${missing[@]}"; then
      die "these packages can't be installed: ${missing[*]}"
    fi
  fi
  allow_services
}

# ensure_machine_id: the client identifier of every post is derived from the machine's ID, which fresh images lack.
ensure_machine_id() {
  [[ -s /etc/machine-id ]] && return
  say "Giving this machine an ID (/etc/machine-id)"
  as_root systemd-machine-id-setup || die "this machine has no ID, and systemd-machine-id-setup could not make one"
}
