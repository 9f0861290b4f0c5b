# Installs the build into a scratch DESTDIR and checks what the desktop
# needs: the program, a desktop entry that desktop-file-validate accepts and
# that starts the installed program through pkexec, the polkit action for
# that program, and the icon in the hicolor theme.
#   cmake -DBUILD_DIR=... -DPREFIX=... -P DesktopInstall.cmake
set(stage ${BUILD_DIR}/desktop-install-test)
file(REMOVE_RECURSE ${stage})
execute_process(COMMAND ${CMAKE_COMMAND} -E env DESTDIR=${stage} ${CMAKE_COMMAND} --install ${BUILD_DIR}
    RESULT_VARIABLE result OUTPUT_QUIET)
if(NOT result EQUAL 0)
    message(FATAL_ERROR "cmake --install failed: ${result}")
endif()
set(root ${stage}${PREFIX})
set(program ${PREFIX}/bin/ftpconfig)

foreach(file bin/ftpconfig share/icons/hicolor/scalable/apps/ftpconfig.svg
        share/icons/hicolor/48x48/apps/ftpconfig.png)
    if(NOT EXISTS ${root}/${file})
        message(FATAL_ERROR "not installed: ${file}")
    endif()
endforeach()
file(READ ${root}/share/icons/hicolor/48x48/apps/ftpconfig.png png HEX)
# Width and height in the PNG header.
string(SUBSTRING "${png}" 32 16 size)
if(NOT size STREQUAL "0000003000000030")
    message(FATAL_ERROR "the hicolor PNG is not 48x48: ${size}")
endif()

set(entry ${root}/share/applications/ftpconfig.desktop)
execute_process(COMMAND desktop-file-validate ${entry} RESULT_VARIABLE result OUTPUT_VARIABLE out ERROR_VARIABLE out)
if(NOT result EQUAL 0 OR out MATCHES "error")
    message(FATAL_ERROR "desktop-file-validate: ${out}")
endif()
file(STRINGS ${entry} exec REGEX "^Exec=")
if(NOT exec STREQUAL "Exec=pkexec ${program}")
    message(FATAL_ERROR "unexpected ${exec}")
endif()

file(GLOB policies ${root}/share/polkit-1/actions/*.policy)
list(LENGTH policies count)
if(NOT count EQUAL 1)
    message(FATAL_ERROR "expected one polkit action file: ${policies}")
endif()
execute_process(COMMAND xmllint --noout ${policies} RESULT_VARIABLE result ERROR_VARIABLE out)
if(NOT result EQUAL 0)
    message(FATAL_ERROR "the polkit action file is not well-formed: ${out}")
endif()
file(READ ${policies} policy)
foreach(expected "<annotate key=\"org.freedesktop.policykit.exec.path\">${program}</annotate>"
        "<annotate key=\"org.freedesktop.policykit.exec.allow_gui\">true</annotate>"
        "<allow_active>auth_admin</allow_active>")
    string(FIND "${policy}" "${expected}" at)
    if(at EQUAL -1)
        message(FATAL_ERROR "the polkit action lacks ${expected}")
    endif()
endforeach()
file(REMOVE_RECURSE ${stage})
