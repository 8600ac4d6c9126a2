# The daemons at work, in namespaces of their own. Sourced by scripts/quickstart, which removes what is left.
#   QUICKSTART_SCRATCH  the directory of the run, with the programs in bin/
#   QUICKSTART_SHARED   what is indexed
#   QUICKSTART_OWN      a directory in it, it or a directory in it, in which files change; it holds those of $scratch/list
#   QUICKSTART_PROMPT   whether to ask for searches
# Standard error is descriptor 3 yet.
# shellcheck shell=bash

exec 2>&3 3>&-
scratch=$QUICKSTART_SCRATCH
volume=$scratch/volume
share=$volume/files
own=$share${QUICKSTART_OWN#"${QUICKSTART_SHARED%/}"}
patience=10 # seconds until a change must be found

# The directory is the only share, on a volume of its own; its index lies beside it, in the scratch directory.
mkdir -p "$share"
exec {kept}<"$scratch"
mount --rbind "$QUICKSTART_SHARED" "$share"
cp -RP --preserve=mode /etc "$scratch/etc" 2>/dev/null || true
for place in /run /var /tmp; do mount -t tmpfs -o mode=1777 quickstart "$place"; done
ln -s /run /var/run
mkdir -p /var/tmp /var/lib
if ! [ -d "$share" ]; then # it lay in one of these places
  mkdir -p "$scratch"
  mount -c --rbind "/proc/$$/fd/$kept" "$scratch"
fi
exec {kept}<&-
cd /
mount --bind "$scratch/etc" /etc # after /run, where mount looks whether fstab has changed
mkdir -p /etc/vexo
printf '[files]\npath = %s\n' "$share" >/etc/vexo/shares.conf
rm -rf /etc/samba
export LD_LIBRARY_PATH=$scratch/bin
PATH=$scratch/bin:$PATH

daemons=()
start() {
  "$@" --foreground </dev/null 2>>"$scratch/daemons" &
  daemons+=($!)
}

# Fails with what the daemons said.
fail_here() {
  tail -n 20 "$scratch/daemons" >&2
  fail "$@"
}

now() { echo "${EPOCHREALTIME/[^0-9]/}"; } # microseconds

# Waits until a command succeeds, for a number of seconds.
await() {
  local end=$(($(now) + $1 * 1000000)) daemon
  shift
  until "$@"; do
    for daemon in "${daemons[@]}"; do kill -0 "$daemon" 2>/dev/null || fail_here "a daemon ended"; done
    [ "$(now)" -lt "$end" ] || return 1
    sleep 0.02
  done
}

# Whether a search finds a path.
finds() {
  local path=$1
  shift
  fileindexctl search --limit 1000 --json "$@" 2>/dev/null | grep -F "\"path\":\"$path\"" >/dev/null
}
finds_not() { ! finds "$@"; }
finds_instead() { finds "$2" "${@:3}" && finds_not "$1" "${@:3}"; }

# What a command prints, with the paths as they are outside of here.
show() {
  local line
  { "$@" 2>&1 || true; } | while IFS= read -r line; do
    case $line in 'PATH  '*) ;; *) echo "    ${line//"$share"/"${QUICKSTART_SHARED%/}"}" ;; esac
  done
}
show_search() {
  local started=$EPOCHREALTIME
  show fileindexctl search "$@"
  echo "    ($(seconds "$started"))"
}

# Says how long a change since $started took to be found; the rest is the command that finds it.
follow() {
  local what=$1 late=''
  shift
  await "$patience" "$@" || fail_here "$what, and no search knew of it after $patience s"
  [ $(($(now) - ${started/[^0-9]/})) -le 1000000 ] || late=', which is more than a second'
  echo "  $what: found after $(seconds "$started")$late"
}

say "Indexing $QUICKSTART_SHARED"
: >"$scratch/daemons"
start vexoelasticd --data "$scratch/engine"
start vexonotifyd
start fileindexd
for socket in vexoelasticd fileindexd; do
  await "$patience" test -S "/run/$socket.sock" || fail_here "$socket did not start"
done
started=$EPOCHREALTIME
fileindexctl folder add /files --name files >"$scratch/log" 2>&1 ||
  { show cat "$scratch/log" >&2 && fail "this directory cannot be indexed: $QUICKSTART_SHARED"; }
fileindexctl status --follow --until-idle || fail_here "the indexing did not come to its end"
last=$own/$(tail -n 1 "$scratch/list")
await "$patience" finds "$last" "${last##*/}" --name || fail_here "all is said to be indexed, and no search finds $last"
echo "  all of it is found after $(seconds "$started")"
if grep -q 'inotify is used$' "$scratch/daemons"; then
  echo "  fanotify takes root; changes are heard by inotify, with one watch for each directory"
fi

say "Changing things"
mkdir "$own/letters"
started=$EPOCHREALTIME
echo "The quickstart wrote this letter, and mentions a quokka." >"$own/letters/letter.txt"
follow "wrote a file" finds "$own/letters/letter.txt" quokka

started=$EPOCHREALTIME
mv "$own/usr/include/linux" "$own/usr/include/kernel"
follow "renamed a directory" \
  finds_instead "$own/usr/include/linux/acct.h" "$own/usr/include/kernel/acct.h" acct.h --name

started=$EPOCHREALTIME
rm "$own/letters/letter.txt"
follow "deleted a file" finds_not "$own/letters/letter.txt" quokka

say "Searching"
if [ -z "$QUICKSTART_PROMPT" ]; then
  for search in keyboard '--name acc'; do
    echo "  \$ fileindexctl search --limit 3 $search"
    # shellcheck disable=SC2086
    show_search --limit 3 $search
  done
  exit
fi

echo "  Words find files; all words must be there. Files in ${QUICKSTART_OWN} may be changed meanwhile."
help() {
  echo "    WORDS       files with all of these words; -WORD: without it; WORD*: that begin so;"
  echo "                \"A PHRASE\", A OR B, name:PART, ext:pdf, type:document, size:>1M, date:7d, path:DIR"
  echo "    :name TEXT  files with a part of their names"
  echo "    :status     what is indexed and what waits"
  echo "    :quit       the end, as Ctrl-D"
}
help
while IFS=$' \t' read -re -p 'search> ' line; do
  history -s -- "$line"
  case $line in
    '') ;;
    :quit) break ;;
    :help) help ;;
    :status) show fileindexctl status ;;
    ':name '*) show_search --name -- "${line#:name }" ;;
    :*) echo "    there is no $line; :help lists what there is" ;;
    *) show_search -- "$line" ;;
  esac
done
