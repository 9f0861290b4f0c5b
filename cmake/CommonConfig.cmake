# One place for the flags and defines of the project's targets. Every
# target links ftpconfig_flags PRIVATE (so that nothing leaks into its
# users); the sanitizers and coverage reach the link of every program.
add_library(ftpconfig_warnings INTERFACE)
target_compile_options(ftpconfig_warnings INTERFACE -Wall -Wextra -Werror)
if(WITH_ASAN)
    target_compile_options(ftpconfig_warnings INTERFACE
        -fsanitize=address,undefined -fno-sanitize-recover=all -fno-omit-frame-pointer)
    target_link_options(ftpconfig_warnings INTERFACE -fsanitize=address,undefined)
endif()
if(WITH_COVERAGE)
    target_compile_options(ftpconfig_warnings INTERFACE --coverage)
    target_link_options(ftpconfig_warnings INTERFACE --coverage)
endif()

# Strings between Qt and bytes are converted where the code says how.
add_library(ftpconfig_flags INTERFACE)
target_link_libraries(ftpconfig_flags INTERFACE ftpconfig_warnings)
target_compile_definitions(ftpconfig_flags INTERFACE
    QT_NO_CAST_FROM_ASCII
    QT_NO_CAST_TO_ASCII
    QT_NO_CAST_FROM_BYTEARRAY
    QT_NO_URL_CAST_FROM_STRING)
