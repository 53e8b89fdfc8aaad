# Completion of teed for fish.
complete -c teed -f
complete -c teed -s h -l help -d 'Print this help message and exit'
complete -c teed -l version -d 'print the version'
complete -c teed -l state -x -a '(__fish_complete_directories)' -d 'folder of the device'
complete -c teed -l socket -r -F -d 'path of the socket'
complete -c teed -l socket-mode -x -d 'permissions of the socket, octal'
complete -c teed -l trace -x -a 'error info debug' -d 'print the trace on standard error'
complete -c teed -l keep-trace -x -a 'error info debug' -d 'what to keep of the trace for kmctl tee log'
complete -c teed -l max-connections -x -d 'connections at once'
complete -c teed -l max-sessions -x -d 'sessions of a connection'
complete -c teed -l max-memory -x -d 'shared memory of a process, in MiB'
