# A system in a directory, started with a systemd of its own. Sourced.

# boot ROOT SCRIPT: starts what is in ROOT in namespaces of its own, without a network, runs SCRIPT (a path in ROOT) in it
# as a service, prints what that printed and ends as it did. Takes root, and cgroup2, where a group is made for the while.
boot() {
  cat >"$1/etc/systemd/system/boot-script.service" <<END
[Service]
Type=exec
RuntimeMaxSec=15min
WorkingDirectory=/root
StandardOutput=append:/boot-script.out
StandardError=inherit
ExecStart=/bin/bash -c 'bash $2; echo \$\$? >/boot-script.status'
ExecStopPost=/bin/bash -c 'kill -s RTMIN+4 1'
[Install]
WantedBy=multi-user.target
END
  ln -sf multi-user.target "$1/etc/systemd/system/default.target"
  mkdir -p "$1/etc/systemd/system/multi-user.target.wants" "$1/outside"
  ln -sf ../boot-script.service "$1/etc/systemd/system/multi-user.target.wants/"
  rm -f "$1/boot-script.out" "$1/boot-script.status"
  unshare --mount bash -c '
    trap : INT TERM  # what was made is removed in any case
    groups=$(mktemp -d)
    mount -t cgroup2 none "$groups" && mkdir "$groups/boot-$$" && echo $$ >"$groups/boot-$$/cgroup.procs" || exit 1
    unshare --mount --pid --fork --kill-child --net --ipc --uts --cgroup bash -ec '\''
      hostname booted; cd "$1"; mount --bind . .; cd "$1"
      mount -t proc proc proc; mount -t sysfs -o ro sysfs sys; mount -t cgroup2 cgroup2 sys/fs/cgroup
      mount -t tmpfs -o mode=755 run run; mount -t tmpfs -o mode=755 dev dev; mkdir dev/pts dev/shm; ln -s /proc/self/fd pts/ptmx dev/
      mount -t devpts -o newinstance,ptmxmode=666 devpts dev/pts; mount -t tmpfs shm dev/shm
      for device in null zero full random urandom tty; do : >dev/$device; mount --bind /dev/$device dev/$device; done
      pivot_root . outside; umount -l /outside
      exec env -i container=unshare PATH=/usr/sbin:/usr/bin:/sbin:/bin /lib/systemd/systemd --system'\'' booted "$1"
    echo $$ >"$groups/cgroup.procs"
    find "$groups/boot-$$" -depth -type d -exec rmdir {} +; umount "$groups"; rmdir "$groups"' boot "$1" >"$1/boot.log" 2>&1 || true
  cat "$1/boot-script.out" || cat "$1/boot.log"
  return "$(cat "$1/boot-script.status" 2>/dev/null || echo 1)"
}
