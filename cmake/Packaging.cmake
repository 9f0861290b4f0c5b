# The Debian package, built by `cpack -G DEB` in a configured build
# directory (scripts/package-check.sh builds, checks and installs it). The
# package holds exactly what `cmake --install` installs: the install() rules
# of each folder stay the one list of installed files. Only what Debian asks
# of a package and nobody else needs is added while packaging, by
# DebianPackageFiles.cmake: compressed man pages, the copyright file and
# changelog.Debian.gz.

set(CPACK_PACKAGE_NAME ftpconfig)
set(CPACK_PACKAGE_VENDOR ftpconfig)
set(CPACK_PACKAGE_CONTACT "Seed af0bad47 maintainers <maintainers@users.noreply.c-seed-af0bad47.example>")
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)

set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION admin)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
# What dpkg-shlibdeps cannot see in the binaries. The programs run without
# both: the report and ftpconfig-ctl read and edit any root (a mounted image
# as well as this machine), and root starts the window from a shell without
# pkexec. A desktop that installs the package will want the server it
# configures and the desktop entry's way to become root, so both come with a
# default install; a minimal one can leave them out.
set(CPACK_DEBIAN_PACKAGE_RECOMMENDS "vsftpd, pkexec")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "desktop configurator for the vsftpd FTP server")
# The summary is the first line; this is the extended description.
set(CPACK_DEBIAN_PACKAGE_DESCRIPTION "ftpconfig reads the configuration of vsftpd, its PAM service file, the user
lists, the per-user files, the system accounts and the Berkeley DB database
of virtual users, and shows for every local, virtual and anonymous user
whether that user can log in and, if not, which file refuses it, beside a
forecast of what vsftpd and PAM will really do. It writes back only the files
that changed, each atomically.
.
The package contains the window (ftpconfig, started from the desktop through
pkexec), the text and JSON report (ftpconfig-report) and ftpconfig-ctl, which
makes the window's edits from a shell.")

# Read by DebianPackageFiles.cmake while packaging.
set(CPACK_FTPCONFIG_SOURCE_DIR ${PROJECT_SOURCE_DIR})
set(CPACK_PRE_BUILD_SCRIPTS ${PROJECT_SOURCE_DIR}/cmake/DebianPackageFiles.cmake)

include(CPack)
