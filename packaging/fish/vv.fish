# Completion of the vv command for fish.
function __vv_wants_file
    test (commandline -opc)[-1] = --password-file
end

function __vv_offered
    set -l words (commandline -opc)
    vv --complete $words[2..-1] (commandline -ct) 2>/dev/null
end

complete -c vv -f -n 'not __vv_wants_file' -a '(__vv_offered)'
complete -c vv -F -n __vv_wants_file
