# fish completion for tallyctl: asks the tool itself, so that it knows what the tool knows

function __tallyctl_candidates
    set -l words (commandline -opc)
    set -l begun (commandline -ct)
    for line in ($words[1] complete -- $words[2..-1] "$begun" 2>/dev/null)
        switch $line
            case ':file*'
                __fish_complete_path $begun
            case ':dir*'
                __fish_complete_directories $begun
            case '*'
                echo $line
        end
    end
end
complete -c tallyctl -f -a '(__tallyctl_candidates)'
