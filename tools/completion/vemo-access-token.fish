# fish completion for vemo-access-token(8)
#
# Ids are credentials, and completion runs as the user: none is completed, and nothing here runs the
# command.

# Whether the command is one of those named, or missing when none is named.
function __vemo_access_token_in
    for word in (commandline -opc)[2..]
        if not string match -q -- '-*' $word
            contains -- $word $argv
            return
        end
    end
    test (count $argv) -eq 0
end

# "@" and the name of a file.
function __vemo_access_token_at_file
    set -l token (commandline -ct | string replace -r '^--extra=' '')
    if string match -q -- '@*' $token
        __fish_complete_path (string sub -s 2 -- $token) | string replace -r '^' @
    else
        printf '%s\t%s\n' @ 'a file of JSON'
    end
end

# Adds an option to commands: COMMANDS LONG-NAME DESCRIPTION [other arguments of "complete"].
function __vemo_access_token_option
    complete -c vemo-access-token -n "__vemo_access_token_in $argv[1]" -l $argv[2] -d $argv[3] $argv[4..]
end

complete -c vemo-access-token -f

for command in \
    'create:Create a token and print its id, this once' \
    'generate:Print a fresh id' \
    'list:List tokens' \
    'show:Show one token in full' \
    'check:Tell whether a grant would succeed, and why not' \
    'grant:Grant a call, which spends one use of the token' \
    'update:Change fields of a token' \
    'rotate:Give a token a fresh id and print it' \
    'revoke:Delete tokens' \
    'purge:Delete the expired tokens' \
    'stats:Count the tokens, by purpose and by owner' \
    'export:Write all tokens, whole ids included, as JSON lines' \
    'import:Create the tokens of files that export wrote' \
    'init:Make the directory, the file and the table' \
    'doctor:Say what is wrong with the store, and what helps' \
    'tune:Add indexes for a large store' \
    'help:Print what a command takes'
    set -l parts (string split -m 1 : $command)
    complete -c vemo-access-token -n __vemo_access_token_in -a $parts[1] -d $parts[2]
    complete -c vemo-access-token -n '__vemo_access_token_in help' -a $parts[1] -d $parts[2]
    __vemo_access_token_option $parts[1] verbose "Show the library's log lines" -s v
end
complete -c vemo-access-token -s h -l help -d 'Print help and exit'
complete -c vemo-access-token -s V -l version -d 'Print the version and exit'

set -l fields tid bind_sid uid deadline count create_time function webapi_allow extra
set -l forms 'table json jsonl'
set -l columns tid user function uses deadline expires session allows uid created note extra
set -l selecting 'list revoke export'

__vemo_access_token_option "create $selecting" uid 'The owner, as a number' -x -a '(__fish_complete_user_ids)'
__vemo_access_token_option "create $selecting" user 'The owner, by name' -x -a '(__fish_complete_users)'
__vemo_access_token_option create function 'Its purpose' -x
__vemo_access_token_option $selecting function 'Those of this purpose' -x
__vemo_access_token_option 'create update' bind-sid 'Bind it to this login session' -x
__vemo_access_token_option $selecting bind-sid 'Those bound to this login session' -x
__vemo_access_token_option 'create update' ttl 'Lifetime from now' -x
__vemo_access_token_option 'create update' uses 'How many times it can be granted' -x
__vemo_access_token_option 'create update' unlimited 'Any number of times'
__vemo_access_token_option create allow 'An API, and methods of it, that it opens' -x
__vemo_access_token_option 'create update' extra 'Data of your own' -x -a '(__vemo_access_token_at_file)'
__vemo_access_token_option 'create update' note 'A note of yours, kept in the data' -x
__vemo_access_token_option create tid 'An id of your own' -x

__vemo_access_token_option $selecting created-before 'Those made before a time' -x
__vemo_access_token_option $selecting created-after 'Those made then or later' -x
__vemo_access_token_option $selecting opens 'Those that open these methods, or the API alone' -x
__vemo_access_token_option $selecting no-owner 'Those whose owner is no user any more'
__vemo_access_token_option $selecting unlimited 'Those with any number of uses'
__vemo_access_token_option $selecting expired 'Those whose deadline has passed'
__vemo_access_token_option $selecting expiring 'Those that expire within this time' -x
__vemo_access_token_option list sort 'By this field, not by deadline' -x -a (string join " " $fields{,:desc})
__vemo_access_token_option list limit 'The first of them' -x
__vemo_access_token_option list count 'How many there are, no more'
__vemo_access_token_option list show-ids 'Whole ids, not their first 8 characters'

__vemo_access_token_option 'create check grant doctor' output 'The form of the output' -s o -x -a $forms
__vemo_access_token_option 'list show' output 'The form of the output' -s o -x -a "$forms csv"
__vemo_access_token_option 'list show' columns 'These columns of a table or CSV' -x \
    -a "(__fish_append , $columns)"
__vemo_access_token_option stats output 'The form of the output' -s o -x -a "$forms metrics"
__vemo_access_token_option 'list show stats tune' no-header 'No line of titles above a table'
__vemo_access_token_option 'list show' field 'This field only, as it is stored' -x -a "$fields"
__vemo_access_token_option 'list show' utc 'Times in UTC instead of local time'
__vemo_access_token_option 'list show' epoch 'Times in seconds since the epoch'

__vemo_access_token_option grant print-user "Print the owner's name"

__vemo_access_token_option update deadline Expiry -x
__vemo_access_token_option update allow 'What it opens, instead of what it did' -x
__vemo_access_token_option update add-allow 'What it opens besides' -x
__vemo_access_token_option update remove-allow 'What it no longer opens' -x

__vemo_access_token_option rotate grace 'The old id stays good for so long' -x

__vemo_access_token_option revoke all 'Every token there is'
__vemo_access_token_option revoke yes 'Do not ask'
__vemo_access_token_option 'revoke purge' dry-run 'Only tell how many'

__vemo_access_token_option stats prometheus "As metrics for Prometheus' node exporter"

__vemo_access_token_option import partial 'What is there of an export that is not whole'
__vemo_access_token_option import skip-existing 'Leave tokens as they are whose ids are there already'
__vemo_access_token_option import in-steps 'Let programs through in between'

__vemo_access_token_option doctor repair 'Repair what can be'

__vemo_access_token_option tune deadline-only 'No index but that on the deadline'
__vemo_access_token_option tune wal 'The write-ahead journal too'
__vemo_access_token_option tune undo 'Remove the indexes and the write-ahead journal'
__vemo_access_token_option tune dry-run 'Only measure, and tell what would be run'

complete -c vemo-access-token -n '__vemo_access_token_in export import' -F

functions -e __vemo_access_token_option
