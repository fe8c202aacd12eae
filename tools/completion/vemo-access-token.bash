# bash completion for vemo-access-token(8)
#
# Ids are credentials, and completion runs as the user: none is completed, and nothing here runs the
# command.

_vemo_access_token()
{
    local cur prev words cword split
    _init_completion -s -n : || return

    local command= word
    for word in "${words[@]:1:cword-1}"; do
        if [[ $word != -* ]]; then
            command=$word
            break
        fi
    done

    local commands='create generate list show check grant update rotate revoke purge stats
        export import init doctor tune help'
    local selection='--uid --user --function --bind-sid --created-before --created-after --opens'
    selection+=' --no-owner --unlimited --expired --expiring'
    local uses='--uses --unlimited'
    local form='--output'
    local table_form="$form --no-header"
    local token_form="$table_form --columns --field --utc --epoch"
    local options
    case $command in
        create) options="--uid --user --function --ttl $uses --allow --bind-sid --extra --note --tid $form" ;;
        list) options="$selection --sort --limit --count --show-ids $token_form" ;;
        show) options=$token_form ;;
        check) options=$form ;;
        grant) options="--print-user $form" ;;
        rotate) options='--grace' ;;
        update)
            options="$uses --deadline --ttl --allow --add-allow --remove-allow --bind-sid --extra --note"
            ;;
        revoke) options="$selection --all --dry-run --yes" ;;
        purge) options='--dry-run' ;;
        stats) options="--prometheus $table_form" ;;
        doctor) options="--repair $form" ;;
        tune) options='--deadline-only --wal --undo --dry-run --no-header' ;;
        import) options='--partial --skip-existing --in-steps' ;;
        export) options=$selection ;;
        generate | init | help) options= ;;
        '')
            [[ $cur == -* ]] && commands='--help --version'
            COMPREPLY=($(compgen -W "$commands" -- "$cur"))
            return
            ;;
        *) return ;;
    esac
    options+=' --help --version --verbose'

    # The value of an option.
    local columns='tid user function uses deadline expires session allows uid created note extra'
    local option=$prev fields='tid bind_sid uid deadline count create_time function webapi_allow extra'
    [[ $option == -o ]] && option=--output
    if [[ " $options " == *" $option "* ]]; then
        case $option in
            --uid)
                _uids
                return
                ;;
            --user)
                COMPREPLY=($(compgen -u -- "$cur"))
                return
                ;;
            --output)
                local forms='table json jsonl'
                [[ $command == @(list|show) ]] && forms+=' csv'
                [[ $command == stats ]] && forms+=' metrics'
                COMPREPLY=($(compgen -W "$forms" -- "$cur"))
                return
                ;;
            --columns)
                # The names in front of the last comma stay.
                local first=
                [[ $cur == *,* ]] && first=${cur%,*},
                COMPREPLY=($(compgen -P "$first" -W "$columns" -- "${cur##*,}"))
                compopt -o nospace
                return
                ;;
            --field)
                COMPREPLY=($(compgen -W "$fields" -- "$cur"))
                return
                ;;
            --sort)
                COMPREPLY=($(compgen -W "$fields ${fields// /:desc }:desc" -- "$cur"))
                __ltrim_colon_completions "$cur"
                return
                ;;
            --extra)
                _vemo_access_token_at_file
                return
                ;;
            --function | --ttl | --uses | --allow | --add-allow | --remove-allow | --bind-sid | --tid | \
                --note | --grace | --created-before | --created-after | --opens | --expiring | --limit | --deadline)
                return
                ;;
        esac
    fi
    $split && return

    if [[ $cur == -* ]]; then
        COMPREPLY=($(compgen -W "$options" -- "$cur"))
    elif [[ $command == @(export|import) ]]; then
        _filedir
    elif [[ $command == help ]]; then
        COMPREPLY=($(compgen -W "$commands" -- "$cur"))
    fi
} &&
    complete -F _vemo_access_token vemo-access-token

# "@" and the name of a file. Written as "filenames", so that what the shell would take for its own is
# quoted; but the "@" hides from it which are directories.
_vemo_access_token_at_file()
{
    if [[ $cur != @* ]]; then
        [[ $cur ]] || COMPREPLY=(@)
        compopt -o nospace
        return
    fi
    cur=${cur#@}
    _filedir
    local i
    for i in "${!COMPREPLY[@]}"; do
        if [[ -d ${COMPREPLY[i]} ]]; then
            COMPREPLY[i]+=/
            compopt -o nospace
        fi
        COMPREPLY[i]=@${COMPREPLY[i]}
    done
}
