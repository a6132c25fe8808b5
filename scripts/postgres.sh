#!/bin/bash
# usage: scripts/postgres.sh start DIRECTORY [SETTING=VALUE...]
#        scripts/postgres.sh restart|crash|stop DIRECTORY
#        scripts/postgres.sh installed
# Makes a PostgreSQL cluster of its own in DIRECTORY, which must not exist yet, starts it and prints its connection string; it is
# reached through a socket in that directory only, by everybody who may enter it. `crash` ends it as a power failure would,
# `restart` starts it once more, `stop` ends and removes it. What the system has set up of clusters stays as it is. Root becomes
# the user postgres or nobody for it, whom the server accepts.

. "$(dirname "$0")/lib.sh"
[[ $# -ge 2 || ${1:-} == installed ]] || usage 1

command=$1
directory=$(realpath -m "${2:-.}")
shift $(($# < 2 ? $# : 2))

find_binaries() {
    local newest
    newest=$(find /usr/lib/postgresql -mindepth 2 -maxdepth 2 -name bin 2>/dev/null | sort -V | tail -n 1)
    [ -x "$newest/initdb" ] || newest=$(dirname "$(command -v initdb || echo /)")
    [ -x "$newest/initdb" ] || die "PostgreSQL is not installed: $(packages_of postgres)"
    echo "$newest"
}

# Runs a program of the server's as somebody whom it accepts.
as_owner() {
    if [ "$(id -u)" -ne 0 ]; then
        "$@"
    else
        setpriv --reuid "$owner" --regid "$(id -g "$owner")" --clear-groups env HOME="$directory" "$@"
    fi
}

control() {
    (cd / && as_owner "$binaries/pg_ctl" --silent -D "$directory/data" -l "$directory/log" "$@") >/dev/null ||
        { [ ! -e "$directory/log" ] || tail -n 20 "$directory/log" >&2; die "pg_ctl $1 failed"; }
}

make_cluster() {
    [ ! -e "$directory" ] || die "$directory is there already"
    [ ${#directory} -lt 90 ] || die "$directory is too long a name for a socket"
    mkdir -p "$directory"
    [ "$(id -u)" -ne 0 ] || chown "$owner" "$directory"
    (cd / && quietly as_owner "$binaries/initdb" --no-sync --auth=trust --username=postgres --encoding=UTF8 --no-locale \
        -D "$directory/data") || die "initdb failed"
    as_owner tee -a "$directory/data/postgresql.conf" >/dev/null <<SETTINGS
listen_addresses = ''
unix_socket_directories = '$directory'
max_connections = 200
$(printf '%s\n' "$@")
SETTINGS
}

binaries=$(find_binaries)
owner=$(id -un)
[ "$(id -u)" -ne 0 ] || owner=$(getent passwd postgres nobody | head -n 1 | cut -d: -f1)

case $command in
start)
    make_cluster "$@"
    control start --wait
    echo "postgresql:///postgres?host=$directory&user=postgres"
    ;;
restart) control start --wait ;;
installed) ;;
crash) control stop --mode=immediate ;;
stop)
    [ ! -e "$directory/data/postmaster.pid" ] || control stop --mode=fast
    rm -rf "$directory"
    ;;
*) usage 1 ;;
esac
