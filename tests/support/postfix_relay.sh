#!/bin/sh
# A private Postfix instance for the tests, hardened against SMTP smuggling:
# it refuses every line that does not end with CR LF, and relays each message
# it accepts to another server on 127.0.0.1.
#   postfix_relay.sh start DIR PORT RELAY_PORT
#   postfix_relay.sh stop DIR
# Configuration, queue and log live under DIR. Run as root: Postfix starts as
# root and drops to its own user, which must be able to reach DIR.
set -eu
dir=$2
if [ "$1" = stop ]; then
  exec postfix -c "$dir/etc" stop 2>/dev/null
fi
chmod 711 "$dir"
mkdir -p "$dir/etc" "$dir/queue"
cat >"$dir/etc/main.cf" <<CONF
compatibility_level = 3.6
queue_directory = $dir/queue
data_directory = $dir/data
maillog_file = $dir/maillog
maillog_file_prefixes = $dir
myhostname = alertmod-test.localdomain
mydestination =
alias_maps =
inet_interfaces = 127.0.0.1
inet_protocols = ipv4
mynetworks = 127.0.0.0/8
relayhost = [127.0.0.1]:$4
smtpd_forbid_bare_newline = reject
smtpd_forbid_bare_newline_exclusions =
CONF
# Only the services a relay needs, none of them chrooted.
cat >"$dir/etc/master.cf" <<CONF
127.0.0.1:$3 inet n - n - - smtpd
cleanup unix n - n - 0 cleanup
qmgr unix n - n 300 1 qmgr
rewrite unix - - n - - trivial-rewrite
bounce unix - - n - 0 bounce
defer unix - - n - 0 bounce
trace unix - - n - 0 bounce
verify unix - - n - 1 verify
flush unix n - n 1000? 0 flush
proxymap unix - - n - - proxymap
smtp unix - - n - - smtp
relay unix - - n - - smtp
error unix - - n - - error
retry unix - - n - - error
discard unix - - n - - discard
anvil unix - - n - 1 anvil
scache unix - - n - 1 scache
postlog unix-dgram n - n - 1 postlogd
CONF
postfix -c "$dir/etc" start 2>/dev/null || {
  cat "$dir/maillog" >&2
  exit 1
}
