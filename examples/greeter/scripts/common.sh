# Shared by greeter's scripts, which source it from their own directory; not run itself.

PKG=greeter
DEST=${CORVPKG_PKGDEST:-/var/packages/$PKG/target}
VAR=$DEST/var
CONF=$VAR/greeter.conf
# The package's etc dir outlives upgrades and uninstalls, so the record of the scripts
# that ran is kept there. It is made when the package is registered.
ETC=/usr/corv/etc/packages/$PKG
RECORD=$ETC/scripts.log

DEFAULT_GREETING="Good day from the greeter"
DEFAULT_PORT=8766

# The version of the package that the running script came from: the INFO beside its
# scripts/ directory. In an upgrade preupgrade comes from the new package, the uninstall
# scripts from the old one.
script_version() {
    sed -n 's/^version="\(.*\)"$/\1/p' "${0%/*}/../INFO" 2>/dev/null
}

# record WORDS...: appends one line about this run of the script to the record.
record() {
    line="$(date '+%Y-%m-%d %H:%M:%S') ${0##*/} ${CORVPKG_PKG_STATUS:-(no status)}"
    line="$line version=${CORVPKG_PKGVER:-?}${CORVPKG_OLD_PKGVER:+ old=$CORVPKG_OLD_PKGVER}"
    line="$line script-of=$(script_version) as=$(id -un 2>/dev/null || id -u)${*:+ $*}"
    if [ -d "$ETC" ] && [ -w "$ETC" ]; then
        printf '%s\n' "$line" >>"$RECORD"
    elif [ -n "${CORVPKG_PKGINST_TEMP_DIR:-}" ]; then
        # preinst of a fresh install runs before the package is registered, when the etc
        # dir does not exist yet: its line travels with the payload until postinst.
        mkdir -p "$CORVPKG_PKGINST_TEMP_DIR/var" &&
            printf '%s\n' "$line" >>"$CORVPKG_PKGINST_TEMP_DIR/var/scripts.pending"
    fi
}

# tell TEXT: a message for the user who runs the operation, and for the package log.
tell() {
    if [ -n "${CORVPKG_TEMP_LOGFILE:-}" ]; then
        printf '%s\n' "$*" >>"$CORVPKG_TEMP_LOGFILE"
    fi
    printf '%s\n' "$*"
}

# valid_port TEXT: a decimal port from 1024 to 65535.
valid_port() {
    case $1 in
    '' | *[!0-9]*) return 1 ;;
    esac
    [ ${#1} -le 5 ] && [ "$1" -ge 1024 ] && [ "$1" -le 65535 ]
}

# port_in_use PORT: something listens on the TCP port (IPv4 or IPv6).
port_in_use() {
    hex=$(printf '%04X' "$1")
    # Lines "sl: local_address rem_address st ..." with addresses as hex ADDR:PORT; the
    # state 0A is LISTEN.
    grep -Eqs "^ *[0-9]+: [0-9A-F]+:$hex [0-9A-F]+:[0-9A-F]+ 0A " /proc/net/tcp /proc/net/tcp6
}

# write_conf GREETING PORT: the settings that the daemon reads at start.
write_conf() {
    mkdir -p "$VAR" || return 1
    {
        echo "# greeter's settings, from the install wizard; read by bin/greeter-daemon at start."
        printf 'greeting=%s\n' "$1"
        printf 'port=%s\n' "$2"
    } >"$CONF.tmp" && mv -f "$CONF.tmp" "$CONF"
}

# conf_value KEY: a value of the settings file.
conf_value() {
    sed -n "s/^$1=//p" "$CONF" 2>/dev/null
}
