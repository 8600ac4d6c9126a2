# The packages that the build needs, from debian/control, which is the one list of them. Sourced by the scripts.
# shellcheck shell=bash

# A machine with two processors and little memory is the common case; more jobs than that only swap.
jobs() { nproc 2>/dev/null || echo 2; }

# Prints the Build-Depends of a control file, one package a line. The second argument says which:
#   build   what compiling needs
#   all     also what is marked <!nocheck>, for tests, and what only makes packages
build_depends() {
  local control=$1 which=$2
  awk '
    /^[^ \t#]/ { inside = /^Build-Depends:/ }
    inside { sub(/^Build-Depends:/, ""); sub(/#.*/, ""); print }
  ' "$control" | tr ',' '\n' | while read -r package rest; do
    [ -n "$package" ] || continue
    if [ "$which" = build ]; then
      case "$rest" in *'<!nocheck>'*) continue ;; esac
      case "$package" in debhelper* | dh-*) continue ;; esac
    fi
    echo "$package"
  done
}

# Of the packages named on stdin, prints those that are not installed. A virtual package counts as installed when
# something installed provides it.
missing_packages() {
  local status
  status=$(dpkg-query -W -f '${db:Status-Status}\t${Package}, ${Provides}\n' 2>/dev/null |
    sed -n 's/^installed\t//p' | tr ',' '\n' | sed 's/^ *//; s/[ :(].*//' | sort -u)
  sort -u | comm -23 - <(printf '%s\n' "$status")
}

# Installs what is missing, and does nothing, fast, when nothing is.
install_packages() {
  local control=$1 which=$2 missing sudo=
  missing=$(build_depends "$control" "$which" | missing_packages)
  [ -n "$missing" ] || return 0
  # shellcheck disable=SC2086
  set -- $missing
  if [ "$(id -u)" != 0 ]; then
    sudo=sudo
    if ! command -v sudo >/dev/null; then
      echo "These packages are missing, and installing them takes root: $*" >&2
      return 1
    fi
  fi
  echo "Installing what is missing: $*"
  local log
  log=$(mktemp)
  if ! { apt_install "$sudo" "$@" || { $sudo apt-get -q update && apt_install "$sudo" "$@"; }; } >"$log" 2>&1; then
    cat "$log" >&2
    rm -f "$log"
    return 1
  fi
  rm -f "$log"
}

apt_install() {
  local sudo=$1
  shift
  $sudo env DEBIAN_FRONTEND=noninteractive apt-get -q install -y --no-install-recommends "$@" </dev/null
}
