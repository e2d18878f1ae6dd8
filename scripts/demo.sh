#!/usr/bin/env bash
# The sandbox appliance demo: builds the admin tool and the stand-in indexing daemon, sets up a
# throw-away appliance in a temporary root (shares in smb.conf, stand-ins for the service manager,
# the notification tool and the daemon) and walks through the library's operations with
# fileindexctl. Each step shows the tool's output and what changed around it, and checks it:
# anything that misbehaves stops the demo with a message and a non-zero exit status.
set -Eeuo pipefail
export LC_ALL=C # byte order for sorted listings
cd "$(dirname "$0")/.."

./scripts/install-deps.sh
cmake -S . -B build >/dev/null
cmake --build build -j"$(nproc)" --target fileindexctl fileindexd-standin wezotifyd
ctl_bin=$PWD/build/bin/fileindexctl
daemon_bin=$PWD/build/bin/fileindexd-standin
monitor_bin=$PWD/build/bin/wezotifyd

# ---------------------------------------------------------------------------------------------
# Helpers

step_no=0
step_title="setup"
daemon_pid=""
monitor_pid=""
root=""

fail() {
  printf '\ndemo FAILED in step %s (%s): %s\n' "$step_no" "$step_title" "$*" >&2
  exit 1
}
# A failure inside $(...) is reported once, by the command that used it.
trap '[ "$BASH_SUBSHELL" -gt 0 ] || fail "command failed (exit $?) at line $LINENO: $BASH_COMMAND"' ERR

cleanup() {
  if [ -n "$daemon_pid" ]; then
    kill -TERM "$daemon_pid" 2>/dev/null || true
    wait "$daemon_pid" 2>/dev/null || true
  fi
  if [ -n "$monitor_pid" ]; then
    kill -TERM "$monitor_pid" 2>/dev/null || true
    wait "$monitor_pid" 2>/dev/null || true
  fi
  if [ -n "$root" ]; then
    rm -rf "$root"
  fi
}
trap cleanup EXIT
trap 'exit 130' INT TERM

# Text with the sandbox root written as $ROOT, so that lines stay short.
short() { sed "s|$root|\$ROOT|g"; }
indent() { short | sed 's/^/    /'; }

# Lines of FILE after the first N (FILE may be missing).
lines_after() { if [ -f "$1" ]; then tail -n +"$(($2 + 1))" "$1"; fi; }
count_lines() { if [ -f "$1" ]; then wc -l <"$1"; else echo 0; fi; }

step() {
  step_no=$((step_no + 1))
  step_title=$1
  printf '\n=== %s. %s ===\n' "$step_no" "$1"
}

# Runs fileindexctl with the sandbox root, showing the command and its output (stderr too). It
# must exit with $expect_status, 0 unless set for the call (expect_status=1 ctl ...).
ctl() {
  local shown="" arg out status want=${expect_status:-0}
  for arg in "$@"; do
    if [[ $arg =~ ^[][A-Za-z0-9_./@:=,+-]+$ ]]; then shown+=" $arg"; else shown+=" '$arg'"; fi
  done
  printf '$ fileindexctl%s\n' "$shown" | short
  out=$("$ctl_bin" --root "$root" "$@" 2>&1) && status=0 || status=$?
  [ "$status" -eq "$want" ] || fail "fileindexctl $* exited with $status, not $want: $out"
  if [ -n "$out" ]; then printf '%s\n' "$out" | indent; fi
  last_output=$out
}

# expect_output ARGS... -- TEXT...: runs fileindexctl ARGS and checks that its output holds each
# TEXT.
expect_output() {
  local args=() text
  while [ "$#" -gt 0 ] && [ "$1" != "--" ]; do args+=("$1"); shift; done
  [ "$#" -gt 0 ] || fail "expect_output without --"
  shift
  ctl "${args[@]}"
  for text in "$@"; do
    grep -qF -- "$text" <<<"$last_output" ||
      fail "fileindexctl ${args[*]}: expected \"$text\" in its output"
  done
}

expect_contains() {
  [ -f "$1" ] || fail "expected $1 to exist"
  grep -qF -- "$2" "$1" || fail "expected \"$2\" in $1, which holds: $(short <"$1")"
}

expect_lacks() {
  if [ -f "$1" ] && grep -qF -- "$2" "$1"; then fail "did not expect \"$2\" in $1"; fi
}

expect_file() { [ -e "$1" ] || fail "expected $(short <<<"$1") to exist"; }
expect_no_file() { [ ! -e "$1" ] || fail "expected $(short <<<"$1") to be gone"; }

# The daemon prints asynchronously: waits up to five seconds for TEXT among its lines since the
# step began.
expect_daemon() {
  local tries got
  for ((tries = 0; ; tries++)); do
    got=$(lines_after "$daemon_log" "$seen_daemon")
    if grep -qF -- "$1" <<<"$got"; then return 0; fi
    [ "$tries" -lt 50 ] || fail "the daemon did not receive \"$1\"; it got: $(short <<<"$got")"
    sleep 0.1
  done
}

# explain PATH RULE: shows what the tool says of PATH and checks the key of the deciding rule.
explain() {
  local json
  ctl explain "$1"
  json=$("$ctl_bin" --root "$root" --json explain "$1")
  grep -Eq "\"rule\" *: *\"$2\"" <<<"$json" || fail "explain $1: expected the rule $2 in $json"
}

# The registration file of a share's queue: its path with every byte but A-Za-z0-9._- as %XX.
registry_file() {
  local queue=$1 out="" c i
  for ((i = 0; i < ${#queue}; i++)); do
    c=${queue:i:1}
    case $c in
      [A-Za-z0-9._-]) out+=$c ;;
      *) out+=$(printf '%%%02X' "'$c") ;;
    esac
  done
  printf '%s/%s.json' "$registry" "$out"
}
queue_of() { printf '%s/volume1/%s/@eaDir/WEZO@file_index_queue' "$root" "$1"; }

# Queue lines {"data":D,"event":E,"path":"P"} as "update|reindex P D".
queue_events() {
  sed -E -e 's/^\{"data":(.*),"event":([0-9]+),"path":"([^"]*)"\}$/\2 \3 \1/' \
    -e 's/^131072 /update  /' -e 's/^65536 /reindex /' -e 's/ null$//'
}
# The registered queues, one per line: the registry's file names decoded.
registrations() {
  local file name
  for file in "$registry"/*.json; do
    [ -f "$file" ] || continue
    name=${file##*/}
    name=${name%.json}
    printf '%b\n' "${name//%/\\x}"
  done
}
spotlight() { grep -E '^\s*spotlight' "$root/etc/samba/smb.conf" | tr -d '\t'; }
units() {
  local file
  for file in "$demo"/units/*; do
    if [ -f "$file" ]; then printf '%s=%s\n' "${file##*/}" "$(cat "$file")"; fi
  done | paste -sd ' '
}

# Shows what changed since the last call: commands the daemon received, service-manager and
# notification calls, new queue lines, the Spotlight setting, unit states, monitor registrations.
seen_daemon=0 seen_services=0 seen_notify=0 seen_spotlight="" seen_units="" seen_registry=""
declare -A seen_queue=()
changes() {
  local queue now
  {
    lines_after "$daemon_log" "$seen_daemon" | sed 's/^fileindexd: /daemon    /'
    lines_after "$demo/services.log" "$seen_services" | sed 's/^/service   /'
    lines_after "$demo/notify.log" "$seen_notify" | cut -c1-80 | sed 's/^/notify    /'
    for queue in "$root"/volume1/*/@eaDir/WEZO@file_index_queue "${!seen_queue[@]}"; do
      if [ -f "$queue" ]; then
        lines_after "$queue" "${seen_queue[$queue]:-0}" | queue_events | sed 's/^/queue     /'
        seen_queue[$queue]=$(count_lines "$queue")
      elif [ -n "${seen_queue[$queue]:-}" ]; then
        echo "queue     removed $queue"
        unset "seen_queue[$queue]"
      fi
    done
    now=$(spotlight)
    [ "$now" = "$seen_spotlight" ] || echo "smb.conf  $now"
    seen_spotlight=$now
    now=$(units)
    [ "$now" = "$seen_units" ] || echo "units     $now"
    seen_units=$now
    now=$(registrations)
    comm -13 <(echo "$seen_registry") <(echo "$now") | sed '/^$/d; s/^/monitor + /'
    comm -23 <(echo "$seen_registry") <(echo "$now") | sed '/^$/d; s/^/monitor - /'
    seen_registry=$now
  } >"$demo/changes"
  seen_daemon=$(count_lines "$daemon_log")
  seen_services=$(count_lines "$demo/services.log")
  seen_notify=$(count_lines "$demo/notify.log")
  echo "  what changed:"
  if [ -s "$demo/changes" ]; then indent <"$demo/changes"; else echo "    (nothing)"; fi
}

# ---------------------------------------------------------------------------------------------
# The sandbox appliance

root=$(realpath "$(mktemp -d)")
demo=$root/records
daemon_log=$demo/daemon.log
registry=$root/var/lib/wezotifyd/fileindex
printf '\nSandbox appliance in ROOT=%s\n' "$root"
./scripts/sandbox-appliance.sh "$root"

start_daemon() {
  "$daemon_bin" --socket "$root/var/run/fileindexd.sock" --log "$daemon_log" --root "$root" --consume &
  daemon_pid=$!
  expect_daemon "listening on"
}
start_daemon
# The platform's file-change monitor, serving the registrations the library writes.
"$monitor_bin" --root "$root" 2>>"$demo/monitor.log" &
monitor_pid=$!
changes >/dev/null  # what the walkthrough shows is measured from here
echo "Shares photo, video, music, archive (read-only) and surveillance; daemon pid $daemon_pid."

# ---------------------------------------------------------------------------------------------
# The walkthrough

step "Add folders in two shares: the service starts, Spotlight comes on, the daemon hears"
ctl add /photo/2019 --name "Holidays 2019" --photo
ctl add --request '[{"path": "/video/movies", "name": "Movies", "video": true}]'
expect_daemon 'upsert_folder_setting {"folder_path":"/photo/2019"}'
expect_daemon 'upsert_folder_setting {"folder_path":"/video/movies"}'
changes
expect_contains "$demo/services.log" "systemctl start fileindexd.service"
expect_contains "$demo/services.log" "systemctl reload-or-restart smbd.service"
expect_contains "$demo/units/fileindexd.service" active
expect_contains "$root/etc/samba/smb.conf" "spotlight = yes"
for share in photo video; do
  expect_file "$(registry_file "$(queue_of "$share")")"
done
expect_contains "$(queue_of photo)" "\"event\":131072,\"path\":\"$root/volume1/photo/2019\""
expect_contains "$(queue_of video)" "\"event\":131072,\"path\":\"$root/volume1/video/movies\""

step "List the indexed folders with their status and validity"
expect_output list --additional status --additional is_valid -- \
  /photo/2019 /video/movies "2 of 2 folder(s)"
printf '$ fileindexctl --json list | grep total\n'
json=$("$ctl_bin" --root "$root" --json list)
grep -Eo '"total" *: *2' <<<"$json" | indent || fail "the JSON listing does not hold \"total\":2"

step "Ask the C interface whether paths are indexed; explain what may be indexed"
expect_output is-indexed path /photo/2019/a.jpg -- "= 1"
expect_output is-indexed path /photos -- "= 0"
expect_output is-indexed full-path "$root/volume1/video/movies/x" -- "= 1"
expect_output is-indexed share music -- "= 0"
explain /photo/2019 indexable
explain /archive/2018 read_only_share
explain /surveillance/cam1 excluded_share
explain /photo/latest resolves_elsewhere
expect_output storage photo -- "queue: $(queue_of photo)" \
  "database: $root/volume1/photo/@eaDir/WEZO@.fileindexdb"

step "Reindex a whole share"
expect_output reindex /photo -- "/photo"
changes
expect_contains "$(queue_of photo)" "{\"data\":null,\"event\":65536,\"path\":\"$root/volume1/photo\"}"

step "Pause indexing for two hours, then resume"
ctl pause 2
expect_output status -- "indexing: paused" "paused: until 20"
resume_time=$(grep -Eo '\([0-9]+\)' <<<"$last_output" | tr -d '()')
expect_daemon "pause {\"resume_time\":$resume_time}"
ctl resume
expect_daemon 'resume {}'
expect_output status -- "paused: no"
changes

step "The daemon goes away: status says so; a change says what was saved and how to finish"
kill -TERM "$daemon_pid"
wait "$daemon_pid" || true
daemon_pid=""
expect_output status -- "daemon: does not answer on $root/var/run/fileindexd.sock" \
  "service fileindexd.service: active"
expect_status=1 expect_output pause 1 -- "saved all the same: paused until" \
  "the step that failed: telling the daemon" "SendCammandToDaemon failed" "to finish:"
start_daemon
ctl resume
expect_daemon 'resume {}'
expect_output status -- "daemon: answers" "paused: no"
changes

step "What the library would accept but not act on: the tool warns, and --strict refuses"
expect_output remove /photo/2019/trip -- "warning: /photo/2019/trip is not in the list" \
  "(it lies in the indexed folder /photo/2019)"
expect_output add /photo/2021 --photo -- "warning: /photo/2021: the directory" "does not exist"
ctl remove /photo/2021
expect_status=1 expect_output --strict add /archive/2018 --photo -- \
  "cannot be indexed: the share is read-only (read_only_share)" "not run: --strict"
expect_output share no-space nosuch -- "warning: no share named nosuch"
printf '$ fileindexctl is-indexed -q path /photo/2019/a.jpg && echo yes\n'
if "$ctl_bin" --root "$root" is-indexed -q path /photo/2019/a.jpg; then echo "    yes"; else
  fail "is-indexed -q: expected exit status 0"
fi
changes

step "A share runs out of room: the administrators are told once; reviving clears it"
ctl share no-space photo on
ctl share no-space photo on
expect_output share no-space photo -- "no-space: yes"
expect_output status /photo/2019 -- "/photo/2019: err_no_space"
[ "$(count_lines "$demo/notify.log")" -eq 1 ] ||
  fail "expected one notification, got $(count_lines "$demo/notify.log")"
ctl share revive photo
expect_daemon 'revive_share_worker {"share_name":"photo"}'
expect_output share no-space photo -- "no-space: no"
expect_output status /photo/2019 -- "/photo/2019: processing"
changes
expect_contains "$demo/notify.log" "fileindex:notify_no_space"

step "Rename the share video to films"
echo "(as the appliance does: the share goes offline, is renamed on disk and in smb.conf, and"
echo " comes back under its new name; the rename itself only moves the folder records)"
ctl share pause video
expect_daemon 'delete_share_worker {"share_name":"video"}'
expect_no_file "$(registry_file "$(queue_of video)")"
mv "$root/volume1/video" "$root/volume1/films"
sed -i -e 's/^\[video\]$/[films]/' -e "s|$root/volume1/video\$|$root/volume1/films|" \
  "$root/etc/samba/smb.conf"
touch -d '-5 seconds' "$root/etc/samba/smb.conf"
seen_queue[$(queue_of films)]=${seen_queue[$(queue_of video)]}  # the queue moved with its share
unset "seen_queue[$(queue_of video)]"
ctl share rename video films
ctl share resume films
expect_daemon 'revive_share_worker {"share_name":"films"}'
expect_file "$(registry_file "$(queue_of films)")"
expect_output list -- /films/movies "2 of 2 folder(s)"
expect_output is-indexed share films -- "= 1"
changes

step "Remove the folders: after the last one the service stops and Spotlight goes off"
ctl remove /films/movies
expect_daemon 'delete_folder_setting {"folder_path":"/films/movies"}'
expect_lacks "$demo/services.log" "systemctl stop fileindexd.service"
ctl remove /photo/2019
expect_output list -- "0 of 0 folder(s)"
changes
expect_contains "$demo/services.log" "systemctl stop fileindexd.service"
expect_contains "$demo/units/fileindexd.service" inactive
expect_contains "$root/etc/samba/smb.conf" "spotlight = no"
expect_no_file "$(registry_file "$(queue_of photo)")"
expect_no_file "$(queue_of photo)"

step "Add folders again, then run the upgrade step"
ctl add --request '[{"path": "/photo/2020", "photo": true}, {"path": "/music/live", "audio": true}]'
changes
echo "(now as on a system just upgraded: no monitor registrations yet, the service stopped)"
rm -f "$registry"/*.json
echo inactive >"$demo/units/fileindexd.service"
changes
expect_output migrate -- "migration done"
changes
expect_contains "$demo/units/fileindexd.service" active
for share in photo music; do
  expect_file "$(registry_file "$(queue_of "$share")")"
done
expect_contains "$(queue_of photo)" "\"event\":65536,\"path\":\"$root/volume1/photo/2020\""
expect_contains "$(queue_of music)" "\"event\":65536,\"path\":\"$root/volume1/music/live\""
expect_contains "$root/etc/samba/smb.conf" "spotlight = yes"

step "Files change in an indexed folder: the monitor queues them, the daemon takes them"
# Waits up to five seconds for the monitor to serve COUNT queues.
expect_monitor() {
  local tries
  for ((tries = 0; tries < 50; tries++)); do
    if tail -n 1 "$demo/monitor.log" | grep -qF "for $1 queues"; then return 0; fi
    sleep 0.1
  done
  fail "the monitor does not serve $1 queues: $(short <"$demo/monitor.log")"
}
# Waits up to five seconds for TEXT in the photo share's queue.
expect_queue() {
  local tries
  for ((tries = 0; tries < 50; tries++)); do
    if grep -qF -- "$1" "$(queue_of photo)" 2>/dev/null; then return 0; fi
    sleep 0.1
  done
  fail "no \"$1\" in the queue of photo"
}
expect_monitor 2
echo "(the daemon takes the queues it has: the folder has nothing left to do)"
printf '$ kill -USR1 <daemon>\n'
kill -USR1 "$daemon_pid"
expect_daemon "of $(queue_of photo)"
expect_output status /photo/2020 -- "/photo/2020: finished"
changes
photo=$root/volume1/photo/2020
printf '$ echo sand >%s/beach.jpg; mv beach.jpg sunset.jpg; mkdir -p raw; rm sunset.jpg\n' \
  "$(short <<<"$photo")"
echo sand >"$photo/beach.jpg"
mv "$photo/beach.jpg" "$photo/sunset.jpg"
mkdir -p "$photo/raw"
rm "$photo/sunset.jpg"
expect_queue "{\"event\":512,\"path\":\"$photo/sunset.jpg\"}"
echo "  the monitor's lines in the queue of photo:"
indent <"$(queue_of photo)"
expect_contains "$(queue_of photo)" "{\"event\":256,\"path\":\"$photo/beach.jpg\"}"
expect_contains "$(queue_of photo)" \
  "{\"event\":256,\"path\":\"$photo/sunset.jpg\",\"path_old\":\"$photo/beach.jpg\"}"
expect_contains "$(queue_of photo)" "{\"event\":256,\"path\":\"$photo/raw\"}"
expect_output status /photo/2020 -- "/photo/2020: processing"
printf '$ kill -USR1 <daemon>\n'
kill -USR1 "$daemon_pid"
expect_daemon "of $(queue_of photo)"
expect_output status /photo/2020 -- "/photo/2020: finished"
expect_no_file "$(queue_of photo)"
changes

printf '\ndemo passed\n'
