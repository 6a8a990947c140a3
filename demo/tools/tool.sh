# Common code of the stand-ins. A tool sets `place` (its own host path) and `switches` (the name of its switch files),
# derives `root` from them, and sources this file, which records the call and obeys the switches (demo/README.md).

if [ -f "$root/var/log/tool-calls.log" ]; then
    /usr/bin/python3 -S -c '
import json, os, sys
call = {"tool": sys.argv[2], "arguments": sys.argv[3:]}
if "KRB5CCNAME" in os.environ:
    call["environment"] = {"KRB5CCNAME": os.environ["KRB5CCNAME"]}
with open(sys.argv[1], "a") as log:
    log.write(json.dumps(call) + "\n")
' "$root/var/log/tool-calls.log" "$place" "$@"
fi

set_to=$root/etc/demo/$switches
answer=
if [ -f "$set_to.daemon" ]; then
    /usr/bin/setsid /bin/sleep "$(cat "$set_to.daemon")" &
    echo $! >"$root/var/run/$switches.daemon.pid"
fi
if [ -f "$set_to.hold" ]; then
    : >"$set_to.held"
    while [ -f "$set_to.hold" ]; do
        /bin/sleep 0.05
    done
fi
if [ -f "$set_to.sleep" ]; then
    /bin/sleep "$(cat "$set_to.sleep")"
fi
if [ -f "$set_to.output" ]; then
    /bin/cat "$set_to.output"
    answer=0
fi
if [ -f "$set_to.error" ]; then
    /bin/cat "$set_to.error" >&2
    answer=0
fi
if [ -f "$set_to.signal" ]; then
    kill -s "$(cat "$set_to.signal")" $$
fi
if [ -f "$set_to.exit" ]; then
    answer=$(cat "$set_to.exit")
fi
if [ -n "$answer" ]; then
    exit "$answer"
fi
