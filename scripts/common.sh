# shellcheck shell=bash disable=SC2034
# What the scripts share; sourced, not run. Leaves the caller in the top folder of the repository.

unset CDPATH  # where it names another tree, cd would go there
cd "$(dirname "${BASH_SOURCE[0]}")/.." || exit

build_packages=(g++ cmake ninja-build uuid-dev libgtest-dev libgmock-dev netbase python3)
package_packages=(dpkg-dev file)
test_packages=(clang-14 libclang-rt-14-dev zsh fish jq "${package_packages[@]}")
cross_packages=(g++-aarch64-linux-gnu qemu-user)
lint_packages=(clang-format clang-tidy flake8 shellcheck mandoc)

# Installs those of the named Debian packages that are missing. Silent when none is, and on systems whose packages
# have other names.
require_packages() {
  command -v dpkg-query >/dev/null || return 0
  local package missing=()
  for package; do
    [[ $(dpkg-query -W -f='${db:Status-Status}' "$package" 2>/dev/null) == installed ]] || missing+=("$package")
  done
  [[ ${#missing[@]} -gt 0 ]] || return 0
  local as_root=(env)
  [[ $(id -u) -eq 0 ]] || as_root=(sudo env)
  echo "Installing ${missing[*]}"
  "${as_root[@]}" DEBIAN_FRONTEND=noninteractive apt-get -qq update
  "${as_root[@]}" DEBIAN_FRONTEND=noninteractive apt-get -qq install --no-install-recommends "${missing[@]}" >/dev/null
}

# Unpacks libuuid for arm64 where the preset of that name looks for it. To install it would have this system know a
# second architecture, and bring its C library along.
provide_arm64_libuuid() {
  local into=$PWD/build/arm64-libuuid
  [[ ! -e $into/usr/lib ]] || return 0
  mkdir -p "$into"/{lists,archives}/partial
  local apt=(apt-get -qq -o APT::Architecture=arm64 -o APT::Architectures=arm64 -o APT::Sandbox::User=root
    -o Dir::State::Lists="$into/lists" -o Dir::Cache="$into" -o Dir::Cache::Archives="$into/archives")
  "${apt[@]}" update
  (cd "$into" && "${apt[@]}" download libuuid1 && dpkg-deb -x libuuid1_*_arm64.deb .)
}

# Configures a preset and builds it, or those of its targets that are named.
build() {
  local preset=$1
  shift
  cmake --preset "$preset" --log-level=WARNING >/dev/null
  cmake --build --preset "$preset" ${1:+--target "$@"}
}
