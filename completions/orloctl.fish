# Completion of orloctl in fish.
function __orloctl_words
    set -l words (commandline -opc)
    set -l typed (commandline -ct)
    for line in ($words[1] --complete $words[2..] "$typed" 2>/dev/null)
        switch $line
            case :files
                __fish_complete_path "$typed"
            case :directories
                __fish_complete_directories "$typed" ''
            case '*'
                echo $line
        end
    end
end
complete -c orloctl -f -k -a '(__orloctl_words)'
