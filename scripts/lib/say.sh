# What the scripts tell a person. Sourced by them; $scratch is the directory of the run.
# shellcheck shell=bash

bold='' plain=''
if [ -t 1 ] && [ -z "${NO_COLOR-}" ]; then bold=$'\e[1m' plain=$'\e[0m'; fi
say() { printf '%s%s%s\n' "$bold" "$*" "$plain"; }
fail() { printf 'quickstart: %s\n' "$*" >&2; exit 1; }

# Says nothing while all goes well.
# shellcheck disable=SC2154
quietly() { "$@" >"$scratch/log" 2>&1 </dev/null || { cat "$scratch/log" >&2; fail "this failed: $*"; }; }

# Since a time of $EPOCHREALTIME.
seconds() { awk -v from="$1" -v to="$EPOCHREALTIME" 'BEGIN { printf "%.2f s", to - from }'; }
