# Sourced by the scripts beside it: makes sure that Debian packages are there.

# What the programs are built from.
build_packages=(
  g++ cmake ninja-build pkg-config ccache
  libjsoncpp-dev libsqlite3-dev libzstd-dev libicu-dev libxml2-dev libuchardet-dev libmd4c-dev
  libseccomp-dev libsodium-dev libcli11-dev libedit-dev
)
# What the tests need beside them.
test_packages=(libgtest-dev libgmock-dev mandoc)

# need_packages NAME... installs those that are missing. Asks nobody when none is, so that it works
# without a network then.
need_packages() {
  local missing=() name
  for name in "$@"; do
    dpkg-query -W -f='${Status}\n' "$name" 2>/dev/null | grep -q 'ok installed' || missing+=("$name")
  done
  [ ${#missing[@]} -eq 0 ] && return 0

  local as_root=()
  if [ "$(id -u)" -ne 0 ]; then
    if ! command -v sudo >/dev/null; then
      echo "These packages are missing and need root to be installed: ${missing[*]}" >&2
      echo "Run as root: apt-get install ${missing[*]}" >&2
      return 1
    fi
    as_root=(sudo)
  fi
  echo "Installing ${missing[*]}" >&2
  "${as_root[@]}" apt-get update -q >&2 &&
    "${as_root[@]}" env DEBIAN_FRONTEND=noninteractive \
      apt-get install -y -q --no-install-recommends "${missing[@]}" >&2
}
