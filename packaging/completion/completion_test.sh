#!/usr/bin/env bash
# Asks the completions what they offer, as the shell would.
set -uo pipefail
here=$(dirname -- "$(readlink -f -- "$0")")
# shellcheck source=packaging/completion/velactl
source "$here/velactl"
# shellcheck source=packaging/completion/vela-reportingd
source "$here/vela-reportingd"
# shellcheck source=packaging/completion/vela-pipewire-reporter
source "$here/vela-pipewire-reporter"

# Without an installed velactl: what `velactl settings --json` begins with.
# shellcheck disable=SC2317  # the completions call it
velactl() {
    if [[ $1 == call ]]; then
        printf '%s\n' 'Operations:' '' '  createReportingSession REPORTER-ID' '  getAllReporters'
        return
    fi
    printf '%s\n' '{"key":"log.target","value":"journal","origin":"default"}' \
        '{"key":"log.level","value":"debug","origin":"file","file":"/x","line":2}'
}

# Without an installed reporter: what `vela-pipewire-reporter --example` prints.
# shellcheck disable=SC2317  # the completions call it
vela-pipewire-reporter() { cat "$here/../pipewire-reporter.toml"; }

status=0
# offers FUNCTION EXPECTED WORD...: the words so far, the last one being typed; EXPECTED has one space between offers.
offers() {
    local function=$1 expected=$2
    shift 2
    COMP_WORDS=("$@")
    COMP_CWORD=$(($# - 1))
    COMPREPLY=()
    "$function"
    if [[ ${COMPREPLY[*]} != "$expected" ]]; then
        printf '%s: offered "%s" in place of "%s"\n' "$*" "${COMPREPLY[*]}" "$expected"
        status=1
    fi
}

folder=$(mktemp -d)
trap 'rm -rf -- "$folder"' EXIT
: >"$folder/one file.toml"

offers _velactl "status sessions call run deliveries defaults notify drivers trace settings plist --help --version" velactl ""
offers _velactl "sessions settings" velactl se
offers _velactl "createReportingSession" velactl call cr
offers _velactl "joule" velactl deliveries --backend j
offers _velactl "--since" velactl deliveries --si
offers _velactl "--settings --set --watch --count --json --help" velactl drivers ""
offers _velactl "" velactl drivers --watch --count ""
offers _velactl "log.level=" velactl drivers --set log.l
offers _velactl "read write delete" velactl defaults ""
offers _velactl "--json" velactl status --j
offers _velactl "$folder/one file.toml" velactl run "$folder/o"
offers _velactl "log.level=" velactl notify x --set log.l
offers _velactl "--settings --set" velactl settings --set
offers _velactl "log.target= log.level=" velactl settings --set ""
offers _velactl "log.level=" velactl settings --set log.l
offers _velactl "$folder/one file.toml" velactl settings --settings "$folder/o"
offers _velactl "emit report --help" velactl trace ""
offers _velactl "" velactl trace emit ""
offers _velactl "--settings --set" velactl trace emit 0x21040100 --se
offers _velactl "log.level=" velactl trace emit 1 --set log.l
offers _velactl "--json" velactl trace report --j
offers _velactl "$folder/one file.toml" velactl trace report "$folder/o"
offers _velactl "json xml binary text" velactl plist x --to ""
offers _velactl "xml" velactl plist x --to x
offers _velactl "--to" velactl plist --t
offers _velactl "$folder/one file.toml" velactl plist "$folder/one"
offers _velactl "" velactl settings --set log.level=
offers _velactl "" velactl settings --set log.level =
offers _velactl "" velactl settings --set log.level = d
offers _velactl "" velactl settings --set log.level = --
offers _velactl "" velactl trace report --set log.level = "$folder/o"
offers _velactl "log.level=" velactl settings --set = log.l
offers _velactl "log.target= log.level=" velactl settings --set =
offers _velactl "" velactl settings --set = log.level =
offers _velactl "$folder/one file.toml" velactl settings --settings = "$folder/o"
offers _velactl "xml" velactl plist --to = x
offers _velactl "--json --help" velactl call --
offers _velactl "" velactl call createReportingSession ""
offers _velactl "--json --settings --set --help" velactl defaults read com.orvex.vela --
offers _velactl "--settings --set --help" velactl defaults delete com.orvex.vela --
offers _velactl "--help" velactl run --
offers _vela_reportingd "" vela-reportingd --check --set log.level =
offers _vela_reportingd "" vela-reportingd --check --set log.level = --
offers _vela_reportingd "" vela-reportingd --check --set log.level=
offers _vela_reportingd "log.target=" vela-reportingd --check --set = log.t
offers _vela_pipewire_reporter "" vela-pipewire-reporter --set statistics.folder = ""
offers _vela_pipewire_reporter "" vela-pipewire-reporter --set statistics.folder=
offers _vela_reportingd "--check --json --settings --set --version --help" vela-reportingd ""
offers _vela_reportingd "--check" vela-reportingd --c
offers _vela_reportingd "$folder/one file.toml" vela-reportingd --check --settings "$folder/"
offers _vela_reportingd "log.target=" vela-reportingd --check --set log.t
offers _vela_pipewire_reporter "--settings --set --check --example --version --help" vela-pipewire-reporter ""
offers _vela_pipewire_reporter "--example" vela-pipewire-reporter --e
offers _vela_pipewire_reporter "$folder/one file.toml" vela-pipewire-reporter --settings "$folder/"
offers _vela_pipewire_reporter "leave_out.applications= leave_out.roles= leave_out.nodes=" vela-pipewire-reporter --set leave
offers _vela_pipewire_reporter "statistics.folder=" vela-pipewire-reporter --check --set statistics.f
exit "$status"
