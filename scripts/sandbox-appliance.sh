#!/usr/bin/env bash
# sandbox-appliance.sh ROOT: makes ROOT (an existing, empty directory) a throw-away appliance for
# the admin tool's demo and tests. Prints nothing; exits non-zero on failure.
#   - /volume1 with the shares photo, video, music, archive (read-only) and surveillance, described
#     in ROOT/etc/samba/smb.conf (Spotlight off), and the folders photo/{2019,2020} (photo/latest
#     links to 2019), video/{movies,series}, music/live, archive/2018, surveillance/cam1;
#   - the directories of the library's fixed paths (tmp, var/run for the daemon's socket
#     var/run/fileindexd.sock, usr/wezo/etc/fileindex, the monitor's registry);
#   - a stand-in usr/bin/systemctl that appends each change to ROOT/records/services.log
#     ("systemctl start fileindexd.service") and keeps each unit's state in
#     ROOT/records/units/<unit> for is-active;
#   - a stand-in usr/wezo/bin/wezohxonotify that appends its arguments to ROOT/records/notify.log.
set -eu
root=${1:?usage: sandbox-appliance.sh ROOT}
records=$root/records

mkdir -p "$root"/{tmp,var/run,var/lib/wezotifyd,usr/wezo/etc/fileindex,usr/wezo/bin,usr/bin}
mkdir -p "$root"/etc/samba "$records"/units
mkdir -p "$root"/volume1/{photo/2019,photo/2020,video/movies,video/series,music/live}
mkdir -p "$root"/volume1/{archive/2018,surveillance/cam1}
ln -s 2019 "$root/volume1/photo/latest"

{
  printf '[global]\n\tworkgroup = DEMO\n\tspotlight = no\n'
  for share in photo video music archive surveillance; do
    read_only=no
    if [ "$share" = archive ]; then read_only=yes; fi
    printf '\n[%s]\n\tpath = %s/volume1/%s\n\tread only = %s\n' "$share" "$root" "$share" "$read_only"
  done
} >"$root/etc/samba/smb.conf"
# A parse is kept only for a file older than two seconds; an older file lets the callers use it.
touch -d '-5 seconds' "$root/etc/samba/smb.conf"

cat >"$root/usr/bin/systemctl" <<SCRIPT
#!/bin/sh
# Stand-in service manager: records each change and keeps each unit's state in a file.
if [ "\$1" = is-active ]; then
  state=\$(cat "$records/units/\$2" 2>/dev/null || echo inactive)
  echo "\$state"
  [ "\$state" = active ]
  exit
fi
echo "systemctl \$*" >>"$records/services.log"
case "\$1" in
  start | restart | reload-or-restart) echo active >"$records/units/\$2" ;;
  stop) echo inactive >"$records/units/\$2" ;;
esac
exit 0
SCRIPT
cat >"$root/usr/wezo/bin/wezohxonotify" <<SCRIPT
#!/bin/sh
# Stand-in notification tool: records its arguments as one line.
echo "\$*" >>"$records/notify.log"
SCRIPT
chmod +x "$root/usr/bin/systemctl" "$root/usr/wezo/bin/wezohxonotify"
