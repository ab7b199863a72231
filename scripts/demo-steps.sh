#!/usr/bin/env bash
# The demo's steps, run inside the sandbox by demo.sh. Arguments: the corvpkg program and
# the corv-store program.
# The whole local life of the example packages (examples/README.md): build, check,
# install with a wizard, run, upgrade, stop, start, shutdown and boot, uninstall; notes, a
# web app with its own database behind the system web server; a share with its ACLs, a
# port file and a command on PATH; and the packages published by a store. The sandbox
# vanishes afterwards. Exits non-zero when a step does not end as the demo expects.
set -uo pipefail
corvpkg=$1
store=${2:-$(dirname "$corvpkg")/../store/corv-store}
cd "$(dirname "${BASH_SOURCE[0]}")/.."
out=/tmp/examples
failures=0

# step TITLE EXPECTED_STATUS ARGS...: runs corvpkg ARGS and checks its exit status. Nothing
# is typed in: on a terminal corvpkg would ask the wizard's questions.
step() {
    local title=$1 expected=$2
    shift 2
    printf '\n==== %s\n$ corvpkg %s\n' "$title" "$*"
    "$corvpkg" "$@" </dev/null
    local status=$?
    printf '(exit status %d)\n' "$status"
    if [ "$status" -ne "$expected" ]; then
        printf '!!!! expected exit status %d\n' "$expected"
        failures=$((failures + 1))
    fi
}

# ask TITLE PORT EXPECTED_TEXT [PATH [HEADER]]: one HTTP request to a daemon on the
# loopback interface, with bash's own /dev/tcp (no curl on the machine needed). Prints the
# body, and the header line named HEADER when given; the text is looked for in both. An
# empty EXPECTED_TEXT expects nobody to answer. A web server reload takes effect a moment
# after it is asked for, so an unexpected answer is asked again for up to 3 seconds.
ask() {
    local title=$1 port=$2 expected=$3 path=${4:-/} header=${5:-} answer tries=15
    printf '\n==== %s\n$ GET http://127.0.0.1:%s%s\n' "$title" "$port" "$path"
    while :; do
        answer=$(timeout 5 bash -c "exec 3<>/dev/tcp/127.0.0.1/$port &&
            printf 'GET %s HTTP/1.0\r\nHost: localhost\r\n\r\n' '$path' >&3 && cat <&3" 2>&1 |
            tr -d '\r')
        if [ -n "$expected" ]; then
            printf '%s' "$answer" | grep -qF -- "$expected" && break
        elif [ -z "$answer" ] || printf '%s' "$answer" | grep -q refused; then
            break
        fi
        tries=$((tries - 1))
        [ "$tries" -gt 0 ] || break
        sleep 0.2
    done
    [ -z "$header" ] || printf '%s\n' "$answer" | sed -n '/^$/q;p' | grep -i "^$header:"
    printf '%s\n' "$answer" | sed -n '/^$/,$p' | sed '1d'
    if [ -n "$expected" ] && ! printf '%s' "$answer" | grep -qF -- "$expected"; then
        printf '!!!! expected an answer with "%s"\n' "$expected"
        failures=$((failures + 1))
    elif [ -z "$expected" ] && [ -n "$answer" ] && ! printf '%s' "$answer" | grep -q refused; then
        printf '!!!! expected no answer\n'
        failures=$((failures + 1))
    fi
}

# offers TITLE TEXT ARGS...: like step (expecting success), and the output must hold TEXT.
offers() {
    local title=$1 expected=$2 output status
    shift 2
    printf '\n==== %s\n$ corvpkg %s\n' "$title" "$*"
    output=$("$corvpkg" "$@")
    status=$?
    printf '%s\n(exit status %d)\n' "$output" "$status"
    if [ "$status" -ne 0 ] || ! printf '%s' "$output" | grep -qF -- "$expected"; then
        printf '!!!! expected success and "%s" in the output\n' "$expected"
        failures=$((failures + 1))
    fi
}

# serve DIR PORT: starts corv-store over DIR on 127.0.0.1:PORT and waits until it answers.
serve() {
    "$store" serve "$1" --listen "127.0.0.1:$2" --log "$1.requests.log" >/dev/null &
    servers+=($!)
    for _ in $(seq 50); do
        (exec 3<>"/dev/tcp/127.0.0.1/$2") 2>/dev/null && return 0
        sleep 0.1
    done
    printf '!!!! corv-store did not start on port %s\n' "$2"
    failures=$((failures + 1))
}
servers=()

# show TITLE COMMAND: runs a shell command; a non-zero exit status is an unexpected outcome.
show() {
    printf '\n==== %s\n$ %s\n' "$1" "$2"
    if ! bash -c "$2"; then
        printf '!!!! expected the command to succeed\n'
        failures=$((failures + 1))
    fi
}

# check TITLE COMMAND EXPECTED_OUTPUT: runs a shell command and compares what it printed.
check() {
    local output
    printf '\n==== %s\n$ %s\n' "$1" "$2"
    output=$(bash -c "$2" 2>&1)
    printf '%s\n' "$output"
    if [ "$output" != "$3" ]; then
        printf '!!!! expected "%s"\n' "$3"
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

show "Publish the example packages as a store: 'corv-store index' writes the catalogue" \
    "'$store' index $out && head -c 400 $out/catalogue.json && echo ..."
show "Serve it on 127.0.0.1:8481, and an empty maker store on 127.0.0.1:8480" \
    "mkdir -p /tmp/maker-store && '$store' index /tmp/maker-store &&
     printf 'package_server=\"http://127.0.0.1:8480\"\n' >>/etc.defaults/corvinfo.conf"
serve /tmp/maker-store 8480
serve "$out" 8481
step "Add the store as a feed" 0 feed add http://127.0.0.1:8481/feed
step "The feeds" 0 feed list
offers "What the stores offer: the feed's hello and greeter (its newest version)" \
    "greeter                  1.1.0-0001" store list --refresh
offers "greeter's store entry: what it needs, where to download it" \
    "http://127.0.0.1:8481/greeter-1.1.0-0001.cpk" store info greeter
show "What the feed store saw: one JSON line per request" \
    "cut -c1-160 $out.requests.log"

# On a terminal (script(1) makes one even when the demo's output goes to a file) each phase
# is one line, redrawn in place; through a pipe the phases are plain lines.
show "Install hello (unsigned, hence --no-verify) as a terminal shows it; it starts after the install" \
    "script -qec '$corvpkg install $out/hello-1.0.0-0001.cpk --no-verify' /dev/null </dev/null"
ask "hello's daemon answers" 8765 "hello from a corvpkg package"

step "greeter's install wizard asks two questions" 0 wizard $out/greeter-1.0.0-0001.cpk
step "Installing without answers is refused with the questions" 2 \
    install $out/greeter-1.0.0-0001.cpk --no-verify
show "A misspelt answer key" "printf '%s\n' '{\"GREETER_PROT\": \"9123\"}' >/tmp/misspelt.json && cat /tmp/misspelt.json"
step "is refused with the keys the wizard asks for" 1 \
    install $out/greeter-1.0.0-0001.cpk --no-verify --answers /tmp/misspelt.json
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
# notes: a web app with a database of its own, behind the system web server.
db_count="psql -X -U postgres -tAc \"SELECT count(*) FROM pg_database WHERE datname = 'notes'\""
step "notes needs PostgreSQL: while it is down, the install fails before the package's scripts" 1 \
    install $out/notes-1.0.0-0001.cpk --no-verify
show "The platform's service manager starts PostgreSQL and nginx" \
    "initctl start pgsql && initctl start nginx"
step "Install notes: its user, its role and database, its portal in nginx" 0 \
    install $out/notes-1.0.0-0001.cpk --no-verify
ask "notes through the system web server, with the rules it asked for" 5000 "notes 1.0.0-0001" \
    /notes/ Content-Security-Policy
ask "Add a note (the text reaches SQL as a quoted literal only)" 5000 "added: buy milk" \
    "/notes/add?text=buy+milk"
ask "A note with a quote" 5000 "added: it's'); DROP TABLE notes; --" \
    "/notes/add?text=it%27s%27%29%3B+DROP+TABLE+notes%3B+--"
check "The notes, read as the package's role in its own database" \
    "psql -X -U notes -d notes -tAc 'SELECT body FROM notes ORDER BY id'" \
    "buy milk
it's'); DROP TABLE notes; --"
step "Upgrade notes to 1.1.0-0001: the database stays" 0 \
    upgrade $out/notes-1.1.0-0001.cpk --no-verify
ask "notes 1.1.0 shows the notes kept across the upgrade" 5000 "buy milk" /notes/
step "Stop notes" 0 stop notes
ask "A stopped package has no portal" 5000 "" /notes/
step "Start notes" 0 start notes
ask "notes answers again" 5000 "notes 1.1.0-0001" /notes/
step "Uninstall notes" 0 uninstall notes
ask "The portal is gone" 5000 "" /notes/
check "Its database was dropped with it" "$db_count" "0"
check "And its role" "psql -X -U postgres -tAc \"SELECT count(*) FROM pg_roles WHERE rolname = 'notes'\"" "0"

# From the store to a running package: greeter named from the maker store, hello with it;
# then an update published, listed, and installed by the scheduled update check.
show "Publish hello and greeter 1.0.0 in the maker store, drop the feed (it has greeter 1.1.0
already), and trust any publisher: the example files are not signed" \
    "cp $out/hello-1.0.0-0001.cpk $out/greeter-1.0.0-0001.cpk /tmp/maker-store/ &&
     '$store' index /tmp/maker-store && '$corvpkg' feed remove http://127.0.0.1:8481/feed &&
     sed -i '/^pkg_source_trust_level=/d' /etc/corvinfo.conf &&
     printf 'pkg_source_trust_level=\"2\"\n' >>/etc/corvinfo.conf"
step "Install greeter by name: the store's order downloads and installs hello first" 0 \
    install greeter --answers /tmp/answers.json
ask "greeter from the store answers, with hello" 9123 "Hello from the demo"
step "No download or install task is left" 0 tasks
show "Publish greeter 1.1.0 in the maker store" \
    "cp $out/greeter-1.1.0-0001.cpk /tmp/maker-store/ && '$store' index /tmp/maker-store"
offers "What can be upgraded (and why not the rest)" "1.1.0-0001" updates --refresh
step "Choose greeter for automatic update: the scheduler's job autopkgupgrade follows" 0 \
    autoupdate set greeter
show "The job as the scheduler keeps it" "cat /etc/cron.d/corvcrond_sys_autopkgupgrade"
show "Run the job's command as cron would: the scheduled update check" \
    "grep -o '/usr/corv/bin/corvpkg chkupgradepkg.*' /etc/cron.d/corvcrond_sys_autopkgupgrade | sh"
ask "greeter 1.1.0 answers, upgraded by the check" 9123 "greeter 1.1.0-0001"
check "The notification the upgrade sent to the desktop" \
    "grep -o 'pkgmgr:upgrade_[a-z_]*completed.Greeter' /var/log/corvnosnotify.log | tr '\t' ' '" \
    "pkgmgr:upgrade_start_pkg_completed Greeter"
check "The desktop's badge: nothing left to update" \
    "cat /var/cache/corv/badge/CORV.NDS.PkgManApp.Instance" "0"
step "Uninstall greeter" 0 uninstall greeter
step "Uninstall hello" 0 uninstall hello

show "What greeter's scripts recorded (the record outlives the package)" \
    "cut -d' ' -f3- /usr/corv/etc/packages/greeter/scripts.log"
show "The system event log" "cut -f2- /var/log/corvevents.log"

for pid in "${servers[@]}"; do
    kill "$pid" 2>/dev/null
done

if [ "$failures" -ne 0 ]; then
    printf '\n==== Demo finished with %d unexpected outcome(s)\n' "$failures"
    exit 1
fi
printf '\n==== Demo finished: every step ended as expected\n'
