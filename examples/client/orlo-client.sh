#!/usr/bin/env bash
# orlo-client.sh export [CLASS...] | certificate | pair URL
#
# Talks to the service with busctl and jq, on the bus that VELTRA_BUS names: exports the identities of the device's components,
# reads the top module's certificate, or pairs with the server at URL and shows what the service logs meanwhile. For the
# last one busctl watches the bus, which takes the rights of its owner.
set -euo pipefail

interface=com.tevari.VeltraPluginServer
follows=false
case ${VELTRA_BUS:-system} in
    system) bus=--system ;;
    session) bus=--user ;;
    *) bus=--address=$VELTRA_BUS ;;
esac

# request ENTRIES COMMAND [ARGUMENT]...: the response as JSON; ARGUMENTs are those of busctl for one entry of messageDict,
# and ENTRIES how many there are.
request() {
    busctl "$bus" --json=short --timeout=3600 call com.tevari.VeltraOrloServices /com/tevari/VeltraOrloServices $interface \
        HandleMessage 'a{sv}' 3 messageStr s "$2" messages b $follows messageDict 'a{sv}' "$1" "${@:3}" | jq .data[1]
}

# Prints a response's dictionary, and fails with the reason of one that tells of a failure.
show() {
    jq -r '(.response.data // {} | to_entries[] | "\(.key): \(.value.data)"),
        if .statusCode.data == 0 then empty
        else (.error.data.description.data // "The service gives no reason.") + "\n" | halt_error(1) end'
}

# Prints the lines that the service logs from now on, until a signal of this script's own comes behind them.
follow() {
    follows=true
    exec {seen}< <(exec busctl "$bus" --json=short monitor 2>&1 --match "type='signal',interface='$interface'" \
        --match "type='signal',interface='$interface.Client'")
    watcher=$!
    read -r <&"$seen" # that busctl has begun
    jq -nr --unbuffered --arg me $$ 'label $out | inputs |
        if .member == "Done" and .payload.data[0] == $me then break $out
        elif .member == "Message" then
            .payload.data | "\(["", "default", "info", "debug", "error"][.[0]])\t\(.[1]): \(.[2])"
        else empty end' <&"$seen" &
    trap 'busctl "$bus" emit / $interface.Client Done s $$; wait $!; kill $watcher' EXIT
}

case ${1-} in
    export) if [ $# -gt 1 ]; then request 1 OrloExport ExportList as $(($# - 1)) "${@:2}"; else request 0 OrloExport; fi | show ;;
    certificate) request 0 getTCRT | show ;;
    pair)
        follow
        request 1 corvoSCPair waftonUrl s "${2-}" | show
        ;;
    *)
        sed -n '2,7s/^# \?//p' "$0" >&2
        exit 2
        ;;
esac
