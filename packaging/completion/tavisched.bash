# Completion of tavisched for bash.

_tavisched() {
    local cur=${COMP_WORDS[COMP_CWORD]} prev=${COMP_WORDS[COMP_CWORD - 1]} word head
    local command='' options='' words=''
    if [[ $cur == = ]]; then # bash makes a word of its own of it
        cur=''
    elif [[ $prev == = ]]; then
        prev=${COMP_WORDS[COMP_CWORD - 2]}
    fi
    for word in "${COMP_WORDS[@]:1:COMP_CWORD-1}"; do
        if [[ $word != -* ]]; then
            case $word in
            ls) command=list ;;
            rm) command=remove ;;
            *) command=$word ;;
            esac
            break
        fi
    done
    COMPREPLY=()

    case $prev in
    --sort) words='id name state schedule next owner last' ;;
    --power) words='on off' ;;
    --owner) words=$(compgen -u) ;;
    --weekly)
        compopt -o nospace 2>/dev/null # a comma and another day may follow
        head=${cur%"${cur##*,}"}
        mapfile -t COMPREPLY < <(compgen -P "$head" -W 'Sun Mon Tue Wed Thu Fri Sat weekdays weekend daily' -- "${cur##*,}")
        return
        ;;
    --name | --command | --at | --monthly | --yearly | --once | --every | --until | --app | --limit | --next | --since | --run | --after | --number | --days | --past) return ;;
    *)
        case $command in
        '')
            options='--version --verbose'
            words='list show next calendar history log export add edit enable disable remove import run stop sync check'
            ;;
        list) options='--all --failed --owner --next --sort --reverse --json' ;;
        show) options='--json' ;;
        next) options='--number --until --all --json' ;;
        calendar) options='--days --past --hours --all --json' ;;
        history) options='--failed --since --limit --json' ;;
        log) options='--run --follow' ;;
        add | edit)
            options='--name --command --at --daily --weekly --monthly --yearly --once --every --until
                --owner --app --enabled --disabled --allow-overlap --no-overlap --power --dry-run --quiet --json'
            ;;
        export) options='--web' ;;
        enable | disable) options='--json' ;;
        remove) options='--yes --json' ;;
        run) options='--wait --missed --json' ;;
        stop) options='--after --json' ;;
        check) options='--repair --json' ;;
        import)
            options='--replace --dry-run --json'
            [[ $cur == -* ]] || compopt -o default 2>/dev/null # names of files
            ;;
        esac
        case $command in
        show | next | history | log | export | edit | enable | disable | remove | run | stop)
            words=$(tavisched complete-ids 2>/dev/null | cut -f 1)
            ;;
        esac
        if [[ $cur == -* ]]; then
            words="$options --help"
        fi
        ;;
    esac
    mapfile -t COMPREPLY < <(compgen -W "$words" -- "$cur")
}

complete -F _tavisched tavisched
