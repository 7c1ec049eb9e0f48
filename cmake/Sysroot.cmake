# marubackup_sysroot(VARIABLE TARGET): where scripts/static-libraries has made the
# libraries for TARGET, such as "powerpc-linux-gnu".
function(marubackup_sysroot variable target)
    if(NOT "$ENV{XDG_CACHE_HOME}" STREQUAL "")
        set(cache $ENV{XDG_CACHE_HOME})
    else()
        set(cache $ENV{HOME}/.cache)
    endif()
    set(${variable} ${cache}/marubackup/${target}/sysroot PARENT_SCOPE)
endfunction()
