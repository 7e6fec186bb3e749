# What the scripts share. Sourced, with bash; moves to the root of the project.

set -euo pipefail

cd "$(dirname "${BASH_SOURCE[0]}")/.."
root=$PWD
jobs=$(nproc)
export CMAKE_BUILD_PARALLEL_LEVEL=$jobs

say() { printf '\n== %s\n' "$*"; }

# Prints the packages of packages.list, with CI=true also those of ci-packages.list, that are not
# installed.
missing_packages() {
  local package lists=("$root/scripts/packages.list")
  [[ ${CI:-} == true ]] && lists+=("$root/scripts/ci-packages.list")
  while read -r package; do
    [[ $(dpkg-query -W -f '${Status}' "$package" 2>/dev/null) == 'install ok installed' ]] ||
      printf '%s\n' "$package"
  done < <(sed 's/#.*//; s/[[:space:]]//g; /^$/d' "${lists[@]}")
}

# Installs what is missing; quiet when nothing is.
install_missing_packages() {
  local missing as_root=()
  mapfile -t missing < <(missing_packages)
  ((${#missing[@]})) || return 0
  if ((EUID != 0)); then
    command -v sudo >/dev/null || {
      echo "Please install, as root: apt-get install ${missing[*]}" >&2
      return 1
    }
    as_root=(sudo)
  fi
  say "Installing ${missing[*]}"
  "${as_root[@]}" apt-get update -qq
  "${as_root[@]}" env DEBIAN_FRONTEND=noninteractive \
    apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
}

# configure_and_build PRESET [TARGET...]: all targets unless some are named.
configure_and_build() {
  local preset=$1 targets=()
  shift
  (($#)) && targets=(--target "$@")
  cmake --preset "$preset" >"$root/.configure.$preset.log" 2>&1 || {
    cat "$root/.configure.$preset.log" >&2
    rm -f "$root/.configure.$preset.log"
    return 1
  }
  rm -f "$root/.configure.$preset.log"
  cmake --build --preset "$preset" -j "$jobs" "${targets[@]}"
}
