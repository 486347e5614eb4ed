# fish completion for lumacastctl: put it into ~/.config/fish/completions

complete -c lumacastctl -f
complete -c lumacastctl -s h -l help -d 'Print help'

complete -c lumacastctl -n __fish_use_subcommand -a status -d 'Show the applications and the running recording'
complete -c lumacastctl -n __fish_use_subcommand -a doctor -d 'Look at all that recording takes'
complete -c lumacastctl -n __fish_use_subcommand -a storage -d 'Show the temporary movies, or have old ones deleted'
complete -c lumacastctl -n __fish_use_subcommand -a save -d 'Save a movie to the Videos folder'
complete -c lumacastctl -n __fish_use_subcommand -a usage -d 'Show the recordings that have ended'
complete -c lumacastctl -n __fish_use_subcommand -a record -d 'Record the whole display'
complete -c lumacastctl -n __fish_use_subcommand -a extensions -d 'Show the upload extensions'
complete -c lumacastctl -n __fish_use_subcommand -a broadcast -d 'Broadcast the whole display'

complete -c lumacastctl -n '__fish_seen_subcommand_from record' -l display -d 'Record the whole display'
complete -c lumacastctl -n '__fish_seen_subcommand_from record' -l duration -x -d 'End after so many seconds'
complete -c lumacastctl -n '__fish_seen_subcommand_from record' -l output -r -F -d 'Where the movie goes'
complete -c lumacastctl -n '__fish_seen_subcommand_from record' -l microphone -d 'Ask for the microphone too; it is never recorded'

complete -c lumacastctl -n '__fish_seen_subcommand_from extensions' -l json -d 'Answer one line of JSON'

complete -c lumacastctl -n '__fish_seen_subcommand_from broadcast' -l display -d 'Broadcast the whole display'
complete -c lumacastctl -n '__fish_seen_subcommand_from broadcast' -l extension -x -d 'The upload extension'
complete -c lumacastctl -n '__fish_seen_subcommand_from broadcast' -l set -x -d 'What the extension is to know'
complete -c lumacastctl -n '__fish_seen_subcommand_from broadcast' -l clip -x -d 'How long a clip is'
complete -c lumacastctl -n '__fish_seen_subcommand_from broadcast' -l duration -x -d 'End after so many seconds'
complete -c lumacastctl -n '__fish_seen_subcommand_from broadcast' -l microphone -d 'Ask for the microphone too; it is never recorded'

complete -c lumacastctl -n '__fish_seen_subcommand_from save' -F
complete -c lumacastctl -n '__fish_seen_subcommand_from save' -l json -d 'Answer lines of JSON'

complete -c lumacastctl -n '__fish_seen_subcommand_from status' -l json -d 'Answer one line of JSON'
complete -c lumacastctl -n '__fish_seen_subcommand_from status' -l watch -d 'Show the running recordings, anew each second'

complete -c lumacastctl -n '__fish_seen_subcommand_from doctor' -l pid -x -a '(__fish_complete_pids)' -d 'Tell which application a process counts as'
complete -c lumacastctl -n '__fish_seen_subcommand_from doctor' -l exe -r -F -d 'Tell which application a program counts as'

complete -c lumacastctl -n '__fish_seen_subcommand_from usage' -l json -d 'Answer one line of JSON'

complete -c lumacastctl -n '__fish_seen_subcommand_from storage' -l json -d 'Answer one line of JSON'
set -l parts list purgeable purge
complete -c lumacastctl -n "__fish_seen_subcommand_from storage; and not __fish_seen_subcommand_from $parts" -a list -d 'Show the movies'
complete -c lumacastctl -n "__fish_seen_subcommand_from storage; and not __fish_seen_subcommand_from $parts" -a purgeable -d 'Show what a purge could give back'
complete -c lumacastctl -n "__fish_seen_subcommand_from storage; and not __fish_seen_subcommand_from $parts" -a purge -d 'Delete as if space were so short'
complete -c lumacastctl -n '__fish_seen_subcommand_from storage; and __fish_seen_subcommand_from purge' -a '1 2 3' -d 'Urgency'
