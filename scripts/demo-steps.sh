#!/usr/bin/env bash
# The demo's steps, run inside the sandbox by demo.sh. Argument: the corvpkg program.
# The whole local life of the example packages (examples/README.md): build, check,
# install with a wizard, run, upgrade, stop, start, shutdown and boot, a share with its
# ACLs, a port file and a command on PATH, uninstall. The sandbox vanishes
# afterwards. Exits non-zero when a step does not end as the demo expects.
set -uo pipefail
corvpkg=$1
cd "$(dirname "${BASH_SOURCE[0]}")/.."
out=/tmp/examples
failures=0

# step TITLE EXPECTED_STATUS ARGS...: runs corvpkg ARGS and checks its exit status.
step() {
    local title=$1 expected=$2
    shift 2
    printf '\n==== %s\n$ corvpkg %s\n' "$title" "$*"
    "$corvpkg" "$@"
    local status=$?
    printf '(exit status %d)\n' "$status"
    if [ "$status" -ne "$expected" ]; then
        printf '!!!! expected exit status %d\n' "$expected"
        failures=$((failures + 1))
    fi
}

# ask TITLE PORT EXPECTED_TEXT: one HTTP request to a daemon on the loopback interface,
# with bash's own /dev/tcp (no curl on the machine needed).
ask() {
    local title=$1 port=$2 expected=$3 answer
    printf '\n==== %s\n$ GET http://127.0.0.1:%s/\n' "$title" "$port"
    answer=$(timeout 5 bash -c "exec 3<>/dev/tcp/127.0.0.1/$port &&
        printf 'GET / HTTP/1.0\r\nHost: localhost\r\n\r\n' >&3 && cat <&3" 2>&1 | tr -d '\r')
    printf '%s\n' "$answer" | sed -n '/^$/,$p' | sed '1d'
    if [ -n "$expected" ] && ! printf '%s' "$answer" | grep -qF -- "$expected"; then
        printf '!!!! expected an answer with "%s"\n' "$expected"
        failures=$((failures + 1))
    elif [ -z "$expected" ] && [ -n "$answer" ] && ! printf '%s' "$answer" | grep -q refused; then
        printf '!!!! expected no answer\n'
        failures=$((failures + 1))
    fi
}

# show TITLE COMMAND: runs a shell command; a non-zero exit status is an unexpected outcome.
show() {
    printf '\n==== %s\n$ %s\n' "$1" "$2"
    if ! bash -c "$2"; then
        printf '!!!! expected the command to succeed\n'
        failures=$((failures + 1))
    fi
}

step "Version of the command line" 0 --version
step "This machine: OS, architecture, volumes" 0 system
show "Build the example packages with 'corvpkg build'" \
    "sh examples/build.sh '$corvpkg' $out && ls -l $out"
step "Look inside a package file" 0 inspect $out/greeter-1.0.0-0001.cpk
step "Can it be installed? greeter needs hello running, and nobody signed the files" 1 \
    check $out/greeter-1.0.0-0001.cpk

step "Install hello (unsigned, hence --no-verify); it starts after the install" 0 \
    install $out/hello-1.0.0-0001.cpk --no-verify
ask "hello's daemon answers" 8765 "hello from a corvpkg package"

step "greeter's install wizard asks two questions" 0 wizard $out/greeter-1.0.0-0001.cpk
step "Installing without answers is refused with the questions" 2 \
    install $out/greeter-1.0.0-0001.cpk --no-verify
show "Our answers" "printf '%s\n' '{\"GREETER_GREETING\": \"Hello from the demo\", \"GREETER_PORT\": \"9123\"}' >/tmp/answers.json && cat /tmp/answers.json"
step "Install greeter with the answers: its user, its job, its cron job" 0 \
    install $out/greeter-1.0.0-0001.cpk --no-verify --answers /tmp/answers.json
step "Installed packages" 0 list
step "greeter's status" 0 status greeter
step "What greeter needs and what needs hello" 0 deps hello
ask "greeter answers with our greeting and what hello says" 9123 "Hello from the demo"
show "greeter runs as its own user" "ps -o user=,args= -C perl | grep greeter || true"

step "Upgrade greeter to 1.1.0-0001: the settings come across" 0 \
    upgrade $out/greeter-1.1.0-0001.cpk --no-verify
ask "greeter 1.1.0 answers, with the greeting chosen at install" 9123 "greeter 1.1.0-0001"
step "A downgrade is refused" 1 install $out/greeter-1.0.0-0001.cpk --no-verify --defaults

step "Stop hello: greeter, which depends on it, stops first" 0 stop hello
step "Installed packages" 0 list
ask "greeter no longer answers" 9123 ""
step "Start hello" 0 start hello
step "Start greeter" 0 start greeter
ask "greeter answers again" 9123 "Hello from the demo"
step "Restart greeter" 0 restart greeter
step "greeter's own log" 0 log greeter

step "Shutdown: every package stops, dependents first; enabled flags stay" 0 stop-all
ask "greeter no longer answers" 9123 ""
step "Boot: every enabled package starts again, dependencies first" 0 start-all
ask "greeter answers after the boot" 9123 "Hello from the demo"

show "Two users for the photos share" "useradd -M -N alice && useradd -M -N bob && id alice bob"
step "Build photos: a share, a port file and a command linked into /usr/local/bin" 0 \
    build examples/photos -o $out/photos-1.0.0-0001.cpk
step "Install photos" 0 install $out/photos-1.0.0-0001.cpk --no-verify
show "The share's ACLs: alice reads and writes, bob reads (an unknown user is left out)" \
    "getfacl -p /volume1/photos"
step "The machine lists the share" 0 system
show "The port file, where the port-conflict check reads it" "cat /usr/local/etc/services.d/photos.sc"
show "The linked command runs from PATH" \
    "touch /volume1/photos/a.jpg /volume1/photos/b.jpg && ls -l /usr/local/bin/photos-count && PATH=/usr/local/bin:/usr/bin:/bin photos-count | grep '2 photo'"
step "Stop photos: its command leaves PATH" 0 stop photos
show "photos-count is gone" "! PATH=/usr/local/bin:/usr/bin:/bin command -v photos-count"
step "Uninstall photos: the share and its photos stay" 0 uninstall photos
show "The photos outlive the package" "ls /volume1/photos && getfacl -p /volume1/photos | grep alice"

step "hello cannot go while greeter depends on it" 1 uninstall hello
step "Uninstall greeter" 0 uninstall greeter
step "Uninstall hello" 0 uninstall hello
step "Installed packages" 0 list
show "What greeter's scripts recorded (the record outlives the package)" \
    "cut -d' ' -f3- /usr/corv/etc/packages/greeter/scripts.log"
show "The system event log" "cut -f2- /var/log/corvevents.log"

if [ "$failures" -ne 0 ]; then
    printf '\n==== Demo finished with %d unexpected outcome(s)\n' "$failures"
    exit 1
fi
printf '\n==== Demo finished: every step ended as expected\n'
