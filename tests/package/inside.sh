# Within the bare system: follows docs/deploy.md section by section, and looks after each whether what
# it promises is so. Ends with what failed, or with a line that counts.
set -u
cd /check
echo 'APT::Get::Assume-Yes "true";' >/etc/apt/apt.conf.d/yes
export PATH=/check/bin:$PATH
mkdir bin && cp systemctl bin/ && chmod +x bin/systemctl
passed=0 failed=0
config=/etc/arbory/arbory.toml
site=https://search.example.net
jar=/check/jar

ok() {  # ok WHAT COMMAND...: the command succeeds
  local what=$1
  shift
  if "$@" >/check/out 2>&1 </dev/null; then
    passed=$((passed + 1))
  else
    failed=$((failed + 1))
    printf 'FAILED: %s\n' "$what"
    sed 's/^/    /' /check/out
  fi
}
has() { grep -qE -- "$1" "$2"; }
not() { ! "$@"; }

# The fenced blocks of a section of the guide, of one language.
blocks() {
  awk -v title="## $1" -v fence="\`\`\`$2" '
    /^## / { inside = ($0 == title) }
    /^```$/ { copying = 0 }
    copying
    inside && $0 == fence { copying = 1; found = 1 }
    END { exit !found }' deploy.md
}
follow() {  # follow SECTION [PATTERN]: runs its commands, those of the lines that match
  blocks "$1" sh | grep -E -- "${2:-.}" >commands || { printf 'FAILED: no commands in %s\n' "$1" && exit 1; }
  while read -r line; do ok "$1: $line" bash -c "$line"; done <commands
}
# Puts a section's keys below the table they name, where the sample has that table.
configure() {
  blocks "$1" toml >keys
  local table
  table=$(head -1 keys)
  tail -n +2 keys >keys-alone
  sed -i "/^\\$table/r keys-alone" "$config"
}
status() { curl -s -o /dev/null -w '%{http_code}' "$@"; }
is_status() { local wanted=$1; shift; [ "$(status "$@")" = "$wanted" ]; }
json() { curl -sS --fail-with-body -b "$jar" -H 'Content-Type: application/json' "$@"; }
login() { curl -sS -o /dev/null -w '%{http_code}' -c "$jar" -H 'Content-Type: application/json' -d '{"user":"ann","password":"'"$2"'"}' "$1/login"; }
logs_in() { [ "$(login "$1" "$2")" = 200 ]; }
# The files that a search finds: finds URL FOLDER PATTERN TEXT
finds() {
  local task
  task=$(json "$1/api/NUVA.Arbory.Search/2/start" -d '{"folder_path": "'"$2"'", "pattern": "'"$3"'"}' |
    sed -n 's/.*"taskid":"\([0-9a-f]*\)".*/\1/p')
  [ "$task" ] || return 1
  for _ in $(seq 100); do
    json "$1/api/NUVA.Arbory.Search/2/list" -d '{"taskid": "'"$task"'", "offset": 0, "limit": 50}' >found
    grep -q '"finished":true' found && break
    sleep 0.1
  done
  grep -q -- "$4" found || { cat found && return 1; }
}

useradd -m -p "$(openssl passwd -6 secret)" ann
mkdir -p /srv/photo/2026 /srv/homes/ann
touch '/srv/photo/2026/Oslo.jpg' /srv/homes/ann/diary.txt
chown -R ann /srv/homes/ann && chmod 700 /srv/homes/ann

local_url=http://127.0.0.1:8750
touch /etc/hosts  # which the proxy's name goes to, below
find / -xdev -path /proc -prune -o -path /check -prune -o -print | sort >before
follow Installing
ok 'the manual is there' test -f /usr/share/man/man1/arbory-search.1.gz
ok 'a person logs in' logs_in "$local_url" secret
ok 'a wrong password does not' not logs_in "$local_url" wrong
ok 'the page is there' has '<script' <(curl -s "$local_url/")
ok 'the terminal searches' has '/srv/photo/2026/Oslo.jpg' <(arbory search oslo /srv/photo)

configure Shares
follow Shares
ok 'a person logs in after a restart' logs_in "$local_url" secret
ok 'a search finds' finds "$local_url" /photo oslo Oslo.jpg

# A share whose folder is missing.
mv /srv/photo /srv/elsewhere && systemctl restart arbory && mv /srv/elsewhere /srv/photo
ok 'a missing folder is told of' has 'arbory.toml:[0-9]+: the share photo .* /srv/photo' arbory.log
systemctl restart arbory
ok 'one that is there is not' not has 'is not offered' arbory.log

follow 'The name index'
ok 'the index is asked' arbory index --check

# The sample as it comes, with each commented key in force.
cp "$config" mine
sed 's/^# \([a-z_]* = \)/\1/' /usr/share/doc/arbory/examples/arbory.toml >"$config"
ok 'the sample has nothing left to uncomment' not has '^# [a-z_]+ =' "$config"
ok 'the server takes every key' systemctl restart arbory
ok 'and so does the index' systemctl restart arbory-index
ok 'a person logs in with the sample' logs_in "$local_url" secret
ok 'the homes of the sample are there' finds "$local_url" /home diary diary.txt
ok 'the photos of the sample are there' finds "$local_url" /photo oslo Oslo.jpg
cp mine "$config"
systemctl stop arbory-index

# Everywhere: the address that is printed is one that works, with the network's own address.
own=127.0.0.1
# Not every kernel has such a device.
if ip link add house type dummy 2>/dev/null; then
  own=192.0.2.7
  ip addr add "$own/24" dev house && ip link set house up
fi
systemctl stop arbory
sed -i '/^\[server\]/a listen = "0.0.0.0:8750"' "$config" && systemctl start arbory
ok 'the printed address works' is_status 200 "$(sed -n 's/^Open //p' arbory.log)health"
ok 'and is the machine'\''s' has "^Open http://$own:8750/" arbory.log
cp mine "$config"

# The proxy. The certificate is one of our own, in the sample's place.
folder=/etc/letsencrypt/live/search.example.net
mkdir -p "$folder"
openssl req -x509 -newkey rsa:2048 -nodes -days 2 -subj /CN=search.example.net \
  -keyout "$folder/privkey.pem" -out "$folder/fullchain.pem" 2>/dev/null
echo '127.0.0.1 search.example.net' >>/etc/hosts
echo "cacert = $folder/fullchain.pem" >~/.curlrc
configure TLS
systemctl restart arbory
follow TLS
ok 'the site answers' is_status 200 "$site/health"
ok 'metrics are the machine'\''s own' is_status 404 "$site/metrics"
ok 'a person logs in through the proxy' logs_in "$site" secret
ok 'the cookie is bound to its host' has '__Host-arbory' "$jar"
ok 'a search finds through the proxy' finds "$site" /photo oslo Oslo.jpg
script=$(curl -s "$site/" | sed -n 's/.*"\(assets\/[^"]*\.js\)".*/\1/p' | head -1)
ok 'the page'\''s script comes packed' has '^content-encoding: gzip' \
  <(curl -s -D - -o /dev/null -H 'Accept-Encoding: gzip' "$site/$script")
ok 'and is what lies on the disk' cmp <(curl -s --compressed "$site/$script") "/usr/share/arbory/web/$script"
ok 'another client comes' is_status 200 --interface 127.0.0.2 "$site/health"
ok 'and is named in the log' has '"peer":"127.0.0.2"' arbory.log
for _ in $(seq 11); do login "$site" wrong >>refusals & done
wait
for _ in $(seq 2); do login "$site" wrong >>refusals; done
ok 'too many refused logins are 429' has 429 refusals

# Clean-all takes bubblewrap.
dpkg --force-depends --remove bubblewrap >/dev/null 2>&1
cp mine "$config" && systemctl restart arbory
ok 'without bubblewrap the server says what will fail' has 'bubblewrap is not installed' arbory.log

follow 'Stopping, upgrading, removing' 'systemctl stop'
nginx -s stop 2>/dev/null
rm /etc/nginx/sites-enabled/arbory /etc/nginx/sites-available/arbory
export DEBIAN_FRONTEND=noninteractive
follow 'Stopping, upgrading, removing' 'remove'
ok 'removing keeps the state' test -d /var/lib/arbory
ok 'and the configuration' test -f "$config"
follow 'Stopping, upgrading, removing' 'purge'
follow 'Stopping, upgrading, removing' 'rm -rf'
find / -xdev -path /proc -prune -o -path /check -prune -o -print | sort >after
comm -13 before after | grep -vE '^/(var/log|var/cache|var/lib/(dpkg|apt|systemd|nginx)|etc/letsencrypt|etc/ssl|run|tmp|root)(/|$)|^/etc/(passwd|group|shadow|gshadow|subuid|subgid)-?$' >left
ok 'nothing is left' not grep . left

printf '%d passed, %d failed\n' "$passed" "$failed"
[ "$failed" = 0 ]
