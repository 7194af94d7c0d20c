# SPDX-License-Identifier: Apache-2.0
# Completion of ldappw for fish: verbs and options are those of the command's own help, all else is a file.
function __ldappw_help
    set -l verb
    for word in (commandline -opc)[2..-1]
        string match -q -- '-*' $word; and continue
        test (count $verb) -lt 1; or test "$verb" = keys; and set -a verb $word
    end
    ldappw $verb --help 2>/dev/null
end
function __ldappw_verbs
    __ldappw_help | string match -rg '^  ([a-z]+)  +([A-Z].*)' | paste - -
end
function __ldappw_options
    __ldappw_help | string match -rg '^  (?:-h,)?(--[a-z-]+)'
end
complete -c ldappw -n '__ldappw_help | string match -q "Subcommands:"' -f -a '(__ldappw_verbs)'
complete -c ldappw -n 'string match -q -- "-*" (commandline -ct)' -a '(__ldappw_options)'
