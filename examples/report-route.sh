#!/bin/sh
# Reports that the sound now goes to another device, to all sessions that run: a hook for udev, for
# example. Needs busctl, which is part of systemd.
#
#   report-route.sh "USB headset"
set -eu

device=${1:?usage: report-route.sh DEVICE}
user=${XDG_RUNTIME_DIR:-/nonexistent}/halvox/reporting.sock
[ -S "$user" ] || user=/run/halvox/reporting.sock
socket=${HALVOX_SOCKET:-$user}

call() {
  busctl --address="unix:path=$socket" --timeout=5 call com.tarno.halvox.reporting \
    /com/tarno/halvox/reporting com.tarno.halvox.HVReportingServiceProtocol "$@"
}

# One entry, the text "active_devices"; the category RouteChange (10), the type State (18); the empty
# list at the end means all started sessions. Each busctl is a connection of its own. It therefore
# cannot have a session: the service ends the sessions of a client that disconnects.
call sendMessage 'a{sv}uqaax' 1 active_devices s "$device" 10 18 0
echo "sessions: $(call getAllReporters)"
