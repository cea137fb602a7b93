# Shared by the host's shell tests (sourced): check DESCRIPTION COMMAND...
# runs the command, prints "ok: ..." or "FAILED: ..." and counts failures in
# $failures, which the test ends on.
failures=0
check() {
    local what=$1
    shift
    if "$@"; then echo "ok: $what"; else
        echo "FAILED: $what"
        failures=$((failures + 1))
    fi
}
