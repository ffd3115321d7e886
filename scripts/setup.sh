# Sourced by ./dev: installs the packages of scripts/packages.txt that are missing.

# packages_of GROUP...: "name version-pattern" of each package of these groups.
packages_of() {
  local name version group
  while read -r name version group; do
    [[ $name == \#* || " $* " != *" $group "* ]] || printf '%s %s\n' "$name" "$version"
  done <scripts/packages.txt
}

# need GROUP...: all packages of these groups are there when it returns.
need() {
  command -v dpkg-query >/dev/null || die "this is no Debian machine; see docs/dependencies.md"
  local -A installed=()
  local name version pattern missing=()
  while read -r name version; do
    installed[$name]=$version
  done < <(dpkg-query -W -f '${db:Status-Abbrev}${Package} ${Version}\n' | sed -n 's/^ii //p')
  while read -r name pattern; do
    version=${installed[$name]:-}
    if [[ -z $version ]]; then
      missing+=("$name=$pattern")
    elif [[ $version != $pattern ]]; then
      warn "$name $version is installed; this project is tested with $pattern"
    fi
  done < <(packages_of "$@")
  ((${#missing[@]} == 0)) || install_packages "${missing[@]}"
}

install_packages() {
  local root=()
  if ((EUID != 0)); then
    command -v sudo >/dev/null || die "as root: apt-get update && apt-get install ${*}"
    root=(sudo)
  fi
  step "Installing ${*%%=*}"
  mkdir -p build
  local apt=("${root[@]}" env DEBIAN_FRONTEND=noninteractive apt-get -q -o Dpkg::Use-Pty=0)
  { "${apt[@]}" update && "${apt[@]}" install -y --no-install-recommends "$@"; } >build/setup.log 2>&1 ||
    { cat build/setup.log >&2 && die "the packages could not be installed"; }
}
