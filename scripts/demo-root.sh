#!/usr/bin/env bash
# Prepares a demo root: a small Debian 12 system with vsftpd's own files as
# the package installs them, and users who can log in and users who cannot,
# each for another reason. Open it with
#   FTPCONFIG_ROOT=DIR scripts/run.sh
#
#   scripts/demo-root.sh DIR
#
# Local users:   bob (allowed), alice (in /etc/ftpusers), eve (not in the
#                userlist, which allows only the listed users), mallory
#                (locked: "!" in /etc/shadow), oscar (home directory missing)
# Virtual users: carol (allowed), webmaster (allowed, own FTP root and
#                write access in its per-user file), dave (not in the userlist)
# Anonymous:     refused (anonymous_enable=NO, Debian's default)
set -euo pipefail

if [ $# -ne 1 ]; then
    echo "usage: $0 DIR" >&2
    exit 2
fi
for f in /etc/vsftpd.conf /etc/pam.d/vsftpd /etc/ftpusers; do
    if [ ! -f "$f" ]; then
        echo "$0: $f is missing; install vsftpd first (scripts/install-deps.sh run)" >&2
        exit 1
    fi
done
command -v db5.3_load >/dev/null || {
    echo "$0: db5.3_load is missing (apt-get install db5.3-util)" >&2
    exit 1
}

root=$(realpath -m "$1")
mkdir -p "$root"
cd "$root"
mkdir -p etc/pam.d etc/vsftpd.d/users.d var/lib/ftpconfig var/run/vsftpd/empty srv/ftp home

# Accounts: Debian's system accounts the lists name, then the demo users.
cat >etc/passwd <<'EOF'
root:x:0:0:root:/root:/bin/bash
daemon:x:1:1:daemon:/usr/sbin:/usr/sbin/nologin
bin:x:2:2:bin:/bin:/usr/sbin/nologin
sys:x:3:3:sys:/dev:/usr/sbin/nologin
www-data:x:33:33:www-data:/var/www:/usr/sbin/nologin
nobody:x:65534:65534:nobody:/nonexistent:/usr/sbin/nologin
ftp:x:107:113:ftp daemon,,,:/srv/ftp:/usr/sbin/nologin
bob:x:1000:1000:Bob:/home/bob:/bin/bash
alice:x:1001:1001:Alice:/home/alice:/bin/bash
eve:x:1002:1002:Eve:/home/eve:/bin/bash
mallory:x:1003:1003:Mallory:/home/mallory:/bin/bash
oscar:x:1004:1004:Oscar:/home/oscar:/bin/bash
EOF
# The hashes only need the form of one; nobody logs in to the demo.
hash='$y$j9T$demo$6kQ3oNQz0d3rY1mZ5y9xN0Y0bRzW8f8b7c6d5e4f3g2'
cat >etc/shadow <<EOF
root:*:19500:0:99999:7:::
daemon:*:19500:0:99999:7:::
bin:*:19500:0:99999:7:::
sys:*:19500:0:99999:7:::
www-data:*:19500:0:99999:7:::
nobody:*:19500:0:99999:7:::
ftp:*:19500:0:99999:7:::
bob:$hash:19500:0:99999:7:::
alice:$hash:19500:0:99999:7:::
eve:$hash:19500:0:99999:7:::
mallory:!:19500:0:99999:7:::
oscar:$hash:19500:0:99999:7:::
EOF
chmod 0640 etc/shadow
cat >etc/group <<'EOF'
root:x:0:
daemon:x:1:
bin:x:2:
sys:x:3:
www-data:x:33:
nogroup:x:65534:
ftp:x:113:
bob:x:1000:
alice:x:1001:
eve:x:1002:
mallory:x:1003:
oscar:x:1004:
EOF
cp /etc/shells etc/shells

# vsftpd's files as Debian installs them, then the demo's changes.
cp /etc/vsftpd.conf etc/vsftpd.conf
cp /etc/pam.d/vsftpd etc/pam.d/vsftpd
for f in /etc/pam.d/common-*; do cp "$f" etc/pam.d/; done
cp /etc/ftpusers etc/ftpusers
echo alice >>etc/ftpusers

# set_option KEY VALUE: replaces the key's line, commented out or not, or
# adds one.
set_option() {
    if grep -qE "^#?$1=" etc/vsftpd.conf; then
        sed -i -E "0,/^#?$1=.*/s||$1=$2|" etc/vsftpd.conf
    else
        echo "$1=$2" >>etc/vsftpd.conf
    fi
}
set_option listen YES
set_option listen_ipv6 NO
set_option local_enable YES
set_option write_enable YES
set_option chroot_local_user YES
set_option allow_writeable_chroot YES
set_option userlist_enable YES
set_option userlist_deny NO
set_option userlist_file /etc/vsftpd.d/allowed_user_list.conf
set_option user_config_dir /etc/vsftpd.d/users.d
set_option guest_enable YES
set_option guest_username ftp
set_option virtual_use_local_privs YES

printf '%s\n' bob alice mallory oscar carol webmaster >etc/vsftpd.d/allowed_user_list.conf

# Virtual users through pam_userdb before Debian's stack, as the
# configurator writes them.
db=/var/lib/ftpconfig/vsftpd_virtual_users
{
    echo "auth	sufficient	pam_userdb.so db=$db"
    echo "account	sufficient	pam_userdb.so db=$db"
    cat /etc/pam.d/vsftpd
} >etc/pam.d/vsftpd
rm -f "var/lib/ftpconfig/vsftpd_virtual_users.db"
printf '%s\n' carol carol-secret dave dave-secret webmaster web-secret \
    | db5.3_load -T -t hash "var/lib/ftpconfig/vsftpd_virtual_users.db"
chmod 0600 var/lib/ftpconfig/vsftpd_virtual_users.db

cat >etc/vsftpd.d/users.d/webmaster <<'EOF'
# File was created by FTP manager
local_root=/srv/www
write_enable=YES
EOF

# Homes: oscar's is missing on purpose.
for user in bob alice eve mallory; do
    mkdir -p "home/$user"
done
chown 1000:1000 home/bob
chown 1001:1001 home/alice
chown 1002:1002 home/eve
chown 1003:1003 home/mallory
chmod 0755 srv/ftp
mkdir -p srv/www
chown 107:113 srv/www
mkdir -p root

echo "demo root ready: $root"
echo "open it with: FTPCONFIG_ROOT=$root scripts/run.sh"
