# Completion of tavisched for fish.

complete -c tavisched -f
complete -c tavisched -s h -l help -d 'Show help'
complete -c tavisched -n __fish_use_subcommand -l version -d 'Show the version'
complete -c tavisched -n __fish_use_subcommand -s v -l verbose -d 'Show the library\'s log lines'

complete -c tavisched -n __fish_use_subcommand -a list -d 'Show the tasks'
complete -c tavisched -n __fish_use_subcommand -a show -d 'Show every field of a task'
complete -c tavisched -n __fish_use_subcommand -a history -d 'Show what runs did'
complete -c tavisched -n __fish_use_subcommand -a log -d 'Show what the last run printed'
complete -c tavisched -n __fish_use_subcommand -a export -d 'Write tasks as a JSON array'
complete -c tavisched -n __fish_use_subcommand -a add -d 'Store a new task'
complete -c tavisched -n __fish_use_subcommand -a edit -d 'Change a task'
complete -c tavisched -n __fish_use_subcommand -a enable -d 'Let tasks run when they are due'
complete -c tavisched -n __fish_use_subcommand -a disable -d 'Keep tasks without running them'
complete -c tavisched -n __fish_use_subcommand -a remove -d 'Remove tasks'
complete -c tavisched -n __fish_use_subcommand -a import -d 'Store the tasks of a JSON array'
complete -c tavisched -n __fish_use_subcommand -a run -d 'Run tasks now'
complete -c tavisched -n __fish_use_subcommand -a stop -d 'End running tasks'
complete -c tavisched -n __fish_use_subcommand -a sync -d 'Write the lines of /etc/crontab anew'
complete -c tavisched -n __fish_use_subcommand -a check -d 'Look for what is wrong with this machine'

complete -c tavisched -n '__fish_seen_subcommand_from show history log export edit enable disable remove rm run stop' \
    -k -a '(tavisched complete-ids 2>/dev/null)'
complete -c tavisched -n '__fish_seen_subcommand_from import' -F

complete -c tavisched -n '__fish_seen_subcommand_from list' -l all -d 'Also those that are not listable'
complete -c tavisched -n '__fish_seen_subcommand_from list' -l failed -d 'Only those whose last run failed'
complete -c tavisched -n '__fish_seen_subcommand_from list' -l owner -d 'Only those of this user' \
    -x -a '(__fish_complete_users)'
complete -c tavisched -n '__fish_seen_subcommand_from list' -l next -x -d 'Only those that run within this time, 24h'
complete -c tavisched -n '__fish_seen_subcommand_from list' -l sort -d 'Field to sort by' \
    -x -a 'id name state schedule next owner last'
complete -c tavisched -n '__fish_seen_subcommand_from list' -l reverse -d 'The other way round'
complete -c tavisched -n '__fish_seen_subcommand_from list show history' -l json -d 'As JSON for scripts'
complete -c tavisched -n '__fish_seen_subcommand_from export' -l web -d 'As the web back end exchanges them'
complete -c tavisched -n '__fish_seen_subcommand_from history' -l limit -x -d 'At most so many'
complete -c tavisched -n '__fish_seen_subcommand_from history' -l failed -d 'Only those without a good end'
complete -c tavisched -n '__fish_seen_subcommand_from history' -l since -x -d 'Only those since then, 7d or YYYY-MM-DD'
complete -c tavisched -n '__fish_seen_subcommand_from log' -l run -x -d 'That run instead of the last one'
complete -c tavisched -n '__fish_seen_subcommand_from log' -l follow -d 'Go on until the run ends'

complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l name -x -d 'What the task is called'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l command -x -d 'Shell command to run'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l at -x -d 'Time of the day, HH:MM'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l daily -d 'Every day'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l weekly -d 'These days of the week' \
    -x -a '(__fish_append , Sun Mon Tue Wed Thu Fri Sat weekdays weekend daily)'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l monthly -x -d 'This day of the month'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l yearly -x -d 'This day of the year, MM-DD'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l once -x -d 'This day alone, YYYY-MM-DD'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l every -x -d 'Again every so many hours'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l until -x -d 'Last hour at which that may start'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l owner -d 'User that the command runs as' \
    -x -a '(__fish_complete_users)'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l app -x -d 'Application that the task belongs to'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l enabled -d 'Run it when it is due'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l disabled -d 'Keep it without running it'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l allow-overlap -d 'Start it beside an earlier run'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l no-overlap -d 'Wait for an earlier run'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -l power -d 'Switch the machine on or off' -x -a 'on off'
complete -c tavisched -n '__fish_seen_subcommand_from add edit' -s q -l quiet -d 'Print the id alone'
complete -c tavisched -n '__fish_seen_subcommand_from add' -l dry-run -d 'Show what would come of it, store nothing'
complete -c tavisched -n '__fish_seen_subcommand_from import' -l replace -d 'Overwrite tasks of the same id and name'
complete -c tavisched -n '__fish_seen_subcommand_from import' -l dry-run -d 'Show what would come of it, store nothing'

complete -c tavisched -n '__fish_seen_subcommand_from remove' -s y -l yes -d 'Do not ask'
complete -c tavisched -n '__fish_seen_subcommand_from run' -l wait -d 'Wait for the end'
complete -c tavisched -n '__fish_seen_subcommand_from run' -l missed -d 'Those that missed their last time'
complete -c tavisched -n '__fish_seen_subcommand_from stop' -l after -x -d 'Kill what is left after so many seconds'
complete -c tavisched -n '__fish_seen_subcommand_from check' -l repair -d 'Repair what needs no person'
