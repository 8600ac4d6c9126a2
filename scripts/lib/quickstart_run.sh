# The daemons at work, in a mount namespace of their own. Sourced by scripts/quickstart, which removes what is left.
#   QUICKSTART_SCRATCH  the directory of the run, with the programs in bin/ and files.tar
#   QUICKSTART_SHARED   what is indexed
#   QUICKSTART_OWN      a directory in it, in which files change; it holds inbox/ already
# shellcheck shell=bash

scratch=$QUICKSTART_SCRATCH
volume=$scratch/volume
share=$volume/files
own=$share${QUICKSTART_OWN#"$QUICKSTART_SHARED"}
patience=10 # seconds until a change must be found

daemons=()
end_daemons() {
  if [ ${#daemons[@]} -gt 0 ]; then kill -KILL "${daemons[@]}" 2>/dev/null && wait "${daemons[@]}" 2>/dev/null; fi || true
}
trap end_daemons EXIT
trap 'exit 143' TERM

# The directory is the only share; its index lies beside it, in the scratch directory.
mkdir -p "$share" "$volume/@fileindex/files"
exec {kept}<"$scratch"
mount --rbind "$QUICKSTART_SHARED" "$share"
cp -RP --preserve=mode /etc "$scratch/etc" 2>/dev/null || true
mount --bind "$scratch/etc" /etc
for place in /run /var; do mount -t tmpfs -o mode=0755 quickstart "$place"; done
ln -s /run /var/run
mkdir -p /var/tmp /var/lib /var/packages/Quarrox/etc /etc/vexo
if ! [ -d "$share" ]; then # it lay in one of these places
  mkdir -p "$scratch"
  mount -c --rbind "/proc/$$/fd/$kept" "$scratch"
fi
printf '[files]\npath = %s\n' "$share" >/etc/vexo/shares.conf
cat >/var/packages/Quarrox/etc/fileindex.folders <<'EOF'
[{"path": "/files", "name": "files", "document": true, "audio": true, "video": true, "photo": true}]
EOF
rm -rf /etc/samba
export LD_LIBRARY_PATH=$scratch/bin
PATH=$scratch/bin:$PATH

start() {
  "$@" </dev/null 2>>"$scratch/daemons" &
  daemons+=($!)
}

# Fails with what the daemons said.
fail_here() {
  tail -n 20 "$scratch/daemons" >&2
  fail "$@"
}

# Waits until a command succeeds, for a number of seconds.
await() {
  local end=$((${EPOCHREALTIME/[^0-9]/} + $1 * 1000000)) daemon
  shift
  until "$@"; do
    for daemon in "${daemons[@]}"; do kill -0 "$daemon" 2>/dev/null || fail_here "a daemon ended"; done
    [ "${EPOCHREALTIME/[^0-9]/}" -lt "$end" ] || return 1
    sleep 0.05
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

# A search as a person types it, with the paths outside of here.
show() {
  local started=$EPOCHREALTIME took
  fileindexctl search --limit 3 "$@" >"$scratch/hits"
  took=$(seconds "$started")
  echo "  \$ fileindexctl search --limit 3 $*"
  share=$share shared=$QUICKSTART_SHARED awk '/^PATH  / { next } {
    while (at = index($0, ENVIRON["share"])) $0 = substr($0, 1, at - 1) ENVIRON["shared"] substr($0, at + length(ENVIRON["share"]))
    print "    " $0
  }' "$scratch/hits"
  echo "    ($took)"
}

# Says how long a change took to be found; the rest is the command that finds it.
follow() {
  local what=$1 started=$2
  shift 2
  await "$patience" "$@" || fail_here "$what, and no search knew of it after $patience s"
  echo "  $what: found after $(seconds "$started")"
}

say "Indexing $QUICKSTART_SHARED"
started=$EPOCHREALTIME
queue=$(fileindexctl share show --json files | sed -n 's/.*"queue_path":"\([^"]*\)".*/\1/p')
: >"$scratch/daemons"
start vexoelasticd --foreground --data "$scratch/engine"
start vexonotifyd --watch "$share" --queue "$queue"
await "$patience" test -S /run/vexoelasticd.sock || fail_here "the search engine did not start"
await "$patience" grep -q '^watching ' "$scratch/daemons" || fail_here "vexonotifyd did not start"
echo '{"event":65536,"path":"'"$share"'"}' >>"$queue"
start fileindexd --foreground
until await "$patience" finds "$own/inbox/usr/include/linux/input.h" input.h --name; do
  # A directory of one's own may hold any number of files.
  [ "$QUICKSTART_SHARED" != "$scratch/scratch" ] || fail_here "nothing was found after $patience s"
  echo "  still indexing after $(seconds "$started")"
done
echo "  all of it is found after $(seconds "$started")"

say "Searching for words, and for names"
show keyboard
show --name keyb

say "Changing things"
started=$EPOCHREALTIME
mkdir "$own/projects"
tar -C "$own/projects" -xf "$scratch/files.tar"
mkdir "$own/projects/letters"
echo "The quickstart wrote this letter, and mentions a quokka." >"$own/projects/letters/letter.txt"
follow "unpacked $(wc -l <"$scratch/files") files" "$started" finds "$own/projects/letters/letter.txt" quokka

started=$EPOCHREALTIME
mv "$own/inbox/usr/include/linux" "$own/inbox/usr/include/kernel"
follow "renamed a directory" "$started" \
  finds_instead "$own/inbox/usr/include/linux/input.h" "$own/inbox/usr/include/kernel/input.h" input.h --name

started=$EPOCHREALTIME
echo "The quokka became a wombat." >"$own/projects/letters/letter.txt"
follow "wrote a file anew" "$started" finds "$own/projects/letters/letter.txt" wombat

started=$EPOCHREALTIME
rm "$own/projects/letters/letter.txt"
follow "deleted a file" "$started" finds_not "$own/projects/letters/letter.txt" wombat
