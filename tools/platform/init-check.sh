#!/bin/sh
# init-check.sh FILE: checks an init job file with the init system's own parser.
# Exit status 0 when it is valid; otherwise 1, with the line and the reason on stderr.
# Installed as /usr/bin/init-check.sh by corv-platform-setup.
[ $# -eq 1 ] || {
    echo "usage: init-check.sh FILE" >&2
    exit 2
}
exec /sbin/initctl check-config "$1"
