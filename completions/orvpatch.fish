# Completion of orvpatch for fish: one home and one action, each with the files that fit it.

# Whether none of these options was given, apart from the one whose value is being completed. Options stand
# at the even places, the program's name at the first.
function __orvpatch_open
    set -l words (commandline -opc)
    for place in (seq 2 2 (math (count $words) - 1))
        contains -- $words[$place] $argv
        and return 1
    end
    return 0
end

# The directories that begin with the current word, and the files of these whose names match. A word that begins
# with the home as ~ is completed with it.
function __orvpatch_paths
    set -l word (commandline -ct)
    __fish_complete_directories $word ''
    set -l begun (string unescape -- $word)
    set -l home ''
    if string match -q '~/*' -- $word
        set home $HOME
        set begun $HOME(string sub -s 2 -- $begun)
    end
    for path in $begun*
        test -f $path
        and string match -rq -- $argv[1] (string replace -r '.*/' '' -- $path)
        or continue
        if test -n "$home"
            set path '~'(string sub -s (math (string length -- $home) + 1) -- $path)
        end
        echo $path
    end
end

set -l patch '^[^_]+_[^_]+_(vema|vems|veps|vepd|vecm)_[^_]*[.]'

complete -c orvpatch -f
complete -c orvpatch -n '__orvpatch_open -h' -o h -x -a '(__fish_complete_directories (commandline -ct) "")' \
    -d 'Installation directory of the product'
complete -c orvpatch -n '__orvpatch_open -i -t -vi' -o i -x -a "(__orvpatch_paths '$patch')" \
    -d 'Install a patch file or a directory of them'
complete -c orvpatch -n '__orvpatch_open -i -t -vi' -o t -x -a "(__orvpatch_paths '$patch')" \
    -d 'Report what an install would do'
complete -c orvpatch -n '__orvpatch_open -i -t -vi' -o vi -x -a "(__orvpatch_paths '[.]ini\$')" \
    -d 'Check a patch descriptor'
