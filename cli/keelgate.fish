# SPDX-License-Identifier: Apache-2.0
# Completion of keelgate for fish. It has no list of its own: options come from the command's help,
# names from what it describes.

function __keelgate_subcommand
    set -l words (commandline -opc)
    for word in $words[2..]
        string match -q -- '-*' $word; or begin
            echo $word
            return
        end
    end
end

function __keelgate_options
    set -l words (commandline -opc)
    $words[1] (__keelgate_subcommand) --help 2>/dev/null |
        string match -ra -- '--[a-z0-9-]+' | sort -u
end

function __keelgate_subcommands
    set -l words (commandline -opc)
    $words[1] --help 2>/dev/null | sed -n '/^Subcommands:/,/^$/s/^  \([a-z]*\) .*/\1/p'
end

# The values under a key of `describe --json`, which has one of them on each line.
function __keelgate_values
    set -l words (commandline -opc)
    $words[1] describe --json 2>/dev/null |
        string match -rg "^ *\"$argv[1]\": \"?([^\",]*)\"?,?\$" | sort -u
end

# The names of everything that `describe` shows: values, and the keys of the named tables.
function __keelgate_names
    set -l words (commandline -opc)
    for key in record unpacker service command
        __keelgate_values $key
    end
    $words[1] describe --json 2>/dev/null | string match -rg '^    "([^"]*)": [[{]'
end

complete -c keelgate -f
complete -c keelgate -n 'test -z (__keelgate_subcommand)' -a '(__keelgate_subcommands)'
complete -c keelgate -n 'string match -q -- "-*" (commandline -ct)' -a '(__keelgate_options)'
complete -c keelgate -n 'contains -- (__keelgate_subcommand) unpack check' -F
complete -c keelgate -n 'contains -- describe (__keelgate_subcommand)' -a '(__keelgate_names)'
complete -c keelgate -l record -x -a '(__keelgate_values record)'
complete -c keelgate -l service -x -a '(__keelgate_values service)'
complete -c keelgate -l command -x -a '(__keelgate_values command)'
complete -c keelgate -l isolation -x -a 'rewind fork'
complete -c keelgate -l log-level -x -a 'none error warning'
complete -c keelgate -l service-path -l connect -l files0-from -l metrics -r -F
complete -c keelgate -l processes -l messages-per-process -l time-limit -l max-message -x
