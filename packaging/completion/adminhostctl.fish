# fish completion of adminhostctl. "adminhostctl complete" knows the words, and asks the daemon for 100 ms at most.

function __adminhostctl_complete
    set -l typed (commandline -opc)
    adminhostctl complete -- $typed[2..-1] (commandline -ct) 2>/dev/null
end

complete -c adminhostctl -f -a '(__adminhostctl_complete)'
