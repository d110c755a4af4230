# Completion of tallyctl(1) for fish.

set -l commands report once states flush display-url upload upload-log watch stats tap

complete -c tallyctl -f
complete -c tallyctl -s h -l help -d 'Show help'
complete -c tallyctl -l root -x -a '(__fish_complete_directories)' -d 'Folder below which the socket lies'
complete -c tallyctl -l socket -r -F -d "The daemon's socket"
complete -c tallyctl -l inspection-socket -r -F -d 'The socket that stats and tap use'
complete -c tallyctl -l timeout -x -d 'Seconds to wait for each answer'
complete -c tallyctl -l json -d 'Print results in JSON'

set -l none "not __fish_seen_subcommand_from $commands"
complete -c tallyctl -n $none -l version -d 'Print the version'
complete -c tallyctl -n $none -a report -d 'Report messages through one session'
complete -c tallyctl -n $none -a once -d 'Send one message without a session'
complete -c tallyctl -n $none -a states -d 'Print the backends that report'
complete -c tallyctl -n $none -a flush -d 'Flush a session'
complete -c tallyctl -n $none -a display-url -d "Print the URL that shows a session's reports"
complete -c tallyctl -n $none -a upload -d 'Upload a file'
complete -c tallyctl -n $none -a upload-log -d 'Upload log data'
complete -c tallyctl -n $none -a watch -d 'Sample this machine and report each sample'
complete -c tallyctl -n $none -a stats -d 'Show what the daemon took and what became of it'
complete -c tallyctl -n $none -a tap -d 'Show what leaves the daemon'

set -l any "__fish_seen_subcommand_from $commands; and not __fish_seen_subcommand_from stats tap"
complete -c tallyctl -n "$any; and not __fish_seen_subcommand_from watch" -l client-type -x -a '5 6 7 8 9 10 11' -d 'Client type'
complete -c tallyctl -n $any -l session-id -x -d 'Session number'
complete -c tallyctl -n $any -l client-version -x -d 'Client version'
complete -c tallyctl -n $any -l require-user-info -d 'Report only once the user info is known'
complete -c tallyctl -n $any -l batch -d 'Let events be batched'
complete -c tallyctl -n $any -l client-name -x -d "The client's name"
complete -c tallyctl -n $any -l service-name -x -d "The service's name"
complete -c tallyctl -n $any -l user-info -x -d 'Further user info, KEY=VALUE'
complete -c tallyctl -n $any -l framework -x -d 'A framework to check'

set -l message '__fish_seen_subcommand_from report once'
complete -c tallyctl -n $message -l category -x -d 'Category of the message'
complete -c tallyctl -n $message -l type -x -d 'Type of the message'

complete -c tallyctl -n '__fish_seen_subcommand_from report' -l messages -r -F -d 'File with a message in JSON on each line'
complete -c tallyctl -n '__fish_seen_subcommand_from report' -l flush-every -x -d 'Flush after every N messages'
complete -c tallyctl -n '__fish_seen_subcommand_from report' -l strict -d 'Stop at the first fault'
complete -c tallyctl -n '__fish_seen_subcommand_from states' -l wait-for-user-info -d 'Read user info from the standard input'
complete -c tallyctl -n '__fish_seen_subcommand_from upload upload-log' -F
complete -c tallyctl -n '__fish_seen_subcommand_from watch' -l interval -x -d 'Seconds between two samples'
complete -c tallyctl -n '__fish_seen_subcommand_from watch' -l count -x -d 'End after N samples'
