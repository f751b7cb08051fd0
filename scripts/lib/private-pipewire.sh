#!/usr/bin/env bash
# A PipeWire of our own: no hardware, no systemd, nothing shared with the desktop's. One null sink
# ("Demo speakers", node demo-speakers) drives the graph with a real clock, so that streams really
# run. Its monitor is the only source. WirePlumber links streams to it.
#
# As a program:  private-pipewire.sh check
#   Prints the missing tools; exits with 1 if there are any.
#                private-pipewire.sh serve DIRECTORY
#   Prints "ready" when streams can run, then "restarted" for each line "restart" that it reads.
#   Stops everything when its standard input ends. The environment for clients is in
#   DIRECTORY/environment, one NAME=value a line.
# Sourced after common.sh:
#   halvox_audio_start DIRECTORY      # starts and waits; exports what clients need
#   halvox_audio_stop
#
# HALVOX_AUDIO_SINK names another factory for the sink, which PipeWire finds in SPA_PLUGIN_DIR.
#
# DIRECTORY must exist, and must be short: a socket's path has at most 107 bytes.

HALVOX_AUDIO_TOOLS=(dbus-daemon dbus-send pipewire wireplumber pw-cli pw-dump pw-play pw-record)

# Prints the missing tools; returns 1 if there are any.
halvox_audio_check() {
  local tool missing=()
  for tool in "${HALVOX_AUDIO_TOOLS[@]}"; do
    command -v "$tool" >/dev/null || missing+=("$tool")
  done
  if ((${#missing[@]} > 0)); then
    printf 'missing: %s\n' "${missing[*]}"
    return 1
  fi
}

halvox_audio_write_configuration() {
  local directory=$1
  mkdir -p "$directory/config/wireplumber/main.lua.d" \
    "$directory/config/wireplumber/bluetooth.lua.d" "$directory/state"
  mkdir -m 700 "$directory/run"
  # Do not use the machine's sound cards.
  printf '%s.enabled = false\n' alsa_monitor v4l2_monitor libcamera_monitor \
    >"$directory/config/wireplumber/main.lua.d/60-no-hardware.lua"
  printf 'bluez_monitor.enabled = false\n' \
    >"$directory/config/wireplumber/bluetooth.lua.d/60-no-hardware.lua"
  cat >"$directory/pipewire.conf" <<END
context.properties = {
    core.daemon = true
    core.name = pipewire-0
    link.max-buffers = 16
    mem.warn-mlock = false
    support.dbus = false
}
context.spa-libs = {
    audio.convert.* = audioconvert/libspa-audioconvert
    support.* = support/libspa-support
    halvox.* = halvox-counting-sink
}
context.modules = [
    { name = libpipewire-module-protocol-native }
    { name = libpipewire-module-profiler }
    { name = libpipewire-module-metadata }
    { name = libpipewire-module-spa-device-factory }
    { name = libpipewire-module-spa-node-factory }
    { name = libpipewire-module-client-node }
    { name = libpipewire-module-client-device }
    { name = libpipewire-module-access args = { } }
    { name = libpipewire-module-adapter }
    { name = libpipewire-module-link-factory }
    { name = libpipewire-module-session-manager }
]
context.objects = [
    { factory = adapter
      args = {
        factory.name = ${HALVOX_AUDIO_SINK:-support.null-audio-sink}
        node.name = demo-speakers
        node.description = "Demo speakers"
        media.class = Audio/Sink
        object.linger = true
        audio.position = [ FL FR ]
        priority.driver = 10000
        priority.session = 1000
        monitor.channel-volumes = true
      }
    }
]
END
}

# Sets the caller's environment so that it and its children use the private server.
halvox_audio_enter() {
  local directory=$1
  unset PIPEWIRE_REMOTE PIPEWIRE_RUNTIME_DIR PIPEWIRE_CONFIG_DIR PIPEWIRE_CONFIG_NAME
  unset WIREPLUMBER_CONFIG_DIR WIREPLUMBER_DATA_DIR DISPLAY WAYLAND_DISPLAY
  export XDG_RUNTIME_DIR=$directory/run
  export XDG_CONFIG_HOME=$directory/config
  export XDG_STATE_HOME=$directory/state
  export DBUS_SESSION_BUS_ADDRESS=unix:path=$directory/run/bus
}

# Both servers are asked instead of looked for: a socket's file exists before the server listens, and
# WirePlumber ends at once when it is refused then.
halvox_audio_bus_answers() {
  dbus-send --session --print-reply --dest=org.freedesktop.DBus / org.freedesktop.DBus.GetId
}
# A tool that has just connected waits forever if PipeWire ends at that moment.
halvox_audio_ask() { timeout 5 "$@" </dev/null; }
halvox_audio_pipewire_answers() { halvox_audio_ask pw-cli info 0; }

# Whether WirePlumber links streams to the sink. A sink becomes the default when it has ports, and
# this one gets them from WirePlumber, after the scripts that link streams have been loaded. With
# adapter.auto-port-config it would have ports from the start, would be the default too early, and a
# stream that came then would be refused with "no node available".
halvox_audio_has_default_sink() { halvox_audio_ask pw-dump | grep -q '"default.audio.sink"'; }

# Waits for what the process just started must do: DIRECTORY WHAT SECONDS COMMAND. Shows all logs if
# it does not.
halvox_audio_wait() {
  local directory=$1
  shift
  halvox_wait_for_start "$HALVOX_PID" "$@" && return
  tail -n 15 "$directory"/*.log >&2
  return 1
}

halvox_audio_start_servers() {
  local directory=$1
  halvox_start pipewire "$directory/pipewire.log" pipewire -c "$directory/pipewire.conf"
  HALVOX_PIPEWIRE_PID=$HALVOX_PID
  halvox_audio_wait "$directory" "PipeWire" 10 halvox_audio_pipewire_answers
  halvox_start wireplumber "$directory/wireplumber.log" wireplumber
  HALVOX_WIREPLUMBER_PID=$HALVOX_PID
  halvox_audio_wait "$directory" "WirePlumber to find the sink" 20 halvox_audio_has_default_sink
}

halvox_audio_stop_servers() {
  halvox_stop "$HALVOX_WIREPLUMBER_PID"
  halvox_stop "$HALVOX_PIPEWIRE_PID"
  rm -f "$XDG_RUNTIME_DIR"/pipewire-0*
}

halvox_audio_start() {
  local directory=$1
  halvox_audio_check || return 1
  halvox_audio_write_configuration "$directory"
  halvox_audio_enter "$directory"
  halvox_start dbus-daemon "$directory/dbus.log" dbus-daemon --session --nofork --nopidfile \
    "--address=$DBUS_SESSION_BUS_ADDRESS"
  HALVOX_BUS_PID=$HALVOX_PID
  halvox_audio_wait "$directory" "the private bus" 10 halvox_audio_bus_answers
  halvox_audio_start_servers "$directory"
}

halvox_audio_stop() {
  halvox_audio_stop_servers
  halvox_stop "$HALVOX_BUS_PID"
}

halvox_audio_serve() {
  local directory=$1 line
  halvox_clean_up_on_exit
  halvox_audio_start "$directory"
  printf '%s=%s\n' XDG_RUNTIME_DIR "$XDG_RUNTIME_DIR" XDG_CONFIG_HOME "$XDG_CONFIG_HOME" \
    XDG_STATE_HOME "$XDG_STATE_HOME" DBUS_SESSION_BUS_ADDRESS "$DBUS_SESSION_BUS_ADDRESS" \
    >"$directory/environment"
  echo ready
  while read -r line; do
    if [ "$line" = restart ]; then
      halvox_audio_stop_servers
      halvox_audio_start_servers "$directory"
      echo restarted
    fi
  done
}

if [ "${BASH_SOURCE[0]}" = "$0" ]; then
  set -euo pipefail
  # shellcheck source=scripts/lib/common.sh
  . "$(dirname "${BASH_SOURCE[0]}")/common.sh"
  if [ "${1:-}" = check ]; then
    halvox_audio_check
  elif [ "${1:-}" = serve ] && [ $# -eq 2 ] && [ -d "$2" ]; then
    halvox_audio_serve "$(realpath "$2")"
  else
    echo "usage: private-pipewire.sh check | serve DIRECTORY" >&2
    exit 2
  fi
fi
