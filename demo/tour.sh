#!/bin/sh
# A guided tour of norvo against demo/appliance.conf. Run it through demo/run.sh, which starts
# it inside the sandboxed appliance: on the host it would make home folders and logins.
set -u
if [ "${NORVO_IN_SANDBOX:-}" != 1 ]; then
    echo "tour.sh: run demo/run.sh, which starts this tour inside the demo appliance" >&2
    exit 2
fi
NORVO=${NORVO:-norvo}

step=0

# "$@" as a reader would type it: plain words bare, anything else in single quotes.
print_command() {
    printf '$ norvo'
    for arg in "$@"; do
        case $arg in
        *[!A-Za-z0-9_./@=:,+-]* | '') printf " '%s'" "$arg" ;;
        *) printf ' %s' "$arg" ;;
        esac
    done
    printf '\n'
}

# show EXPLANATION ARGS...: one line saying what the call shows, the call, its answer. A refusal
# is part of the tour, so a failing call does not stop it.
show() {
    step=$((step + 1))
    printf '\n== %d. %s\n' "$step" "$1"
    shift
    print_command "$@"
    "$NORVO" "$@" 2>&1 | sed 's/^/   /'
}

show "A share path leads to the share's folder on its volume" \
    resolve --user alice /photo/2024/beach.jpg
show "/home is each user's own folder under the homes root (made when missing)" \
    resolve --user bob /home/notes.txt
show "Two users, one share: alice may write in photo ..." \
    privilege --user alice /photo/2024
show "... bob may only read there, so uploads are refused" \
    privilege --user bob /photo/2024
show "The ACL mask is asked as the user: alice may not even enter root's private folder" \
    privilege --user alice /photo/private
show "carol is on photo's no-access list: the share refuses everything" \
    privilege --user carol /photo
show "vault is an encrypted share" \
    resolve --user alice /vault/keys.txt
show "bob is on vault's no-access list" \
    privilege --user bob /vault
show "archive is on the read-only /volume2: the share grants read-write, the ACL mask has no write" \
    privilege --user alice /archive/2019
show "... so the path check of a write there fails" \
    check-path --user alice --mode 2 /volume2/archive/2019
show "The shares alice's file manager lists, sorted (backup is hidden)" \
    shares --user alice --sort
show "The shares bob may write to" \
    shares --user bob --writable
show "A name beginning with ._ is reserved" \
    check-name /volume1/photo ._thumbs
show "Before making new/sub/dir: the longest existing part is what gets checked" \
    check-path --find-existing /volume1/photo/new/sub/dir
show "What alice's file manager shows at the top: her home, then her shares (vault included)" \
    ls --user alice /
show "bob sees no vault; archive lies on the read-only /volume2" \
    ls --user bob /
show "The same folder for both: alice enters alice-only ..." \
    ls --user alice /public/alice-only
show "... bob is refused by its mode (0700), judged as bob" \
    ls --user bob /public/alice-only
show "carol is on photo's no-access list: the share refuses the listing" \
    ls --user carol /photo
show "Sorted by size: folders first, then the files from the smallest up" \
    ls --user alice --sort size /photo/2024
show "... descending: the whole list reversed, folders last" \
    ls --user alice --sort size --desc /photo/2024
show "Sorted by owner: by user id (root is 0), not by name" \
    ls --user alice --sort user /photo/2024
show "Paging: the total counts every entry, the page holds two from offset 1" \
    ls --user alice --sort size --offset 1 --limit 2 /photo/2024
show "Only the names the terms match" \
    ls --user bob --name jpg,mov /photo/2024
show "The read-only volume: its share's volume status, as the web interface receives it" \
    --json ls --user bob --info volume_status --sort name --offset 0 --limit 1 /
show "A file entry as the web interface receives it" \
    --json ls --user bob --info size,owner,perm --name sunset /photo/2024
show "Every entry below a folder, as the walker hands it to its callback: type, size, user and real path" \
    walk --user alice /photo
show "The same walk without the share's recycle bin" \
    walk --user alice --skip-recycle /photo
show "bob may not enter photo/private: passed over silently by default, the end of the walk with --ignore none" \
    walk --user bob --ignore none /photo
show "The first folder whole, then each sub-folder; with --first-only the first folder alone, in JSON lines" \
    --json walk --user alice --order first-folder --first-only /photo
show "The folder tree's view of photo: folders only, the dead network mount kept as unreachable" \
    subdirs --user alice /volume1/photo

step=$((step + 1))
printf '\n== %d. %s\n' "$step" "A domain account logs in; the sid is kept for the next calls"
printf "\$ sid=\$(echo secret | norvo login --user 'CORP\\\\dave' --password-stdin --remote-addr 192.0.2.10)\n"
sid=$(echo secret | "$NORVO" login --user 'CORP\dave' --password-stdin --remote-addr 192.0.2.10)
printf '   sid=%s\n' "$sid"
show "With the sid, CORP\\dave's privilege on projects, where downloads are switched off" \
    privilege --user 'CORP\dave' --sid "$sid" /projects/plan.txt
show "Without a valid sid the domain is not asked: the library refuses" \
    privilege --user 'CORP\dave' --sid not-a-sid /projects
show "Every command answers in JSON too, for scripts" \
    --json resolve --user alice /photo/2024/beach.jpg

# carol, who may not see public2, tries the ways out of the share she may see.
show "A user path is one / and a share's name: public/2 does not reach public2 (bad parameter)" \
    ls --user carol public/2
show "Nor does .. lead from public into photo" \
    resolve --user carol /public/../photo
ln -s /volume1/photo /volume1/public/to-photo
chown -h "$(id -u carol)" /volume1/public/to-photo
show "carol made a link in public to photo's folder; the library does not follow it" \
    ls --user carol /public/to-photo
newline=$(printf '\nx')
newline=${newline%x}
mkdir -p /volume1/public/names
touch "/volume1/public/names/a${newline}b" '/volume1/public/names/a\x0Ab'
show "A name with a real line break prints escaped, apart from the four characters \\x0A" \
    ls --user alice /public/names
show "A background task of alice's reports progress into her task store" \
    tasks --user alice start Tovana_demo --steps 3
show "Another request waits until the task has written its progress (limit 300: up to 3 s)" \
    tasks --user alice wait Tovana_demo progress --limit 300
sleep 1
show "The task has finished; a clean-up keeps it until it is two days old" \
    tasks --user alice clean
task=$("$NORVO" --json search-db --user alice --volume /volume1 create | sed 's/.*"task":"\([0-9A-F]*\)".*/\1/')
printf '\n   (alice'"'"'s new search task: %s)\n' "$task"
show "alice's search stores hits in a task database of her own (her folder 0700, the file 0600)" \
    search-db --user alice --volume /volume1 --task "$task" insert /volume1/photo/2024 /volume1/photo/2024/beach.jpg /volume1/photo/2024/party.mov
show "A later request pages the hits sorted by size, largest first" \
    search-db --user alice --volume /volume1 --task "$task" list --sort size --desc --limit 10
show "A task id that getUniqueID would never make reaches no path: no such task" \
    search-db --user alice --volume /volume1 --task ../../etc list
# search_as USER EXPLANATION: USER's search for txt, beach and diary in three shares, then its hits.
search_as() {
    out=$(show "$2" search --user "$1" --name txt,beach,diary /public /photo /archive)
    step=$((step + 1)) # show ran in a subshell
    printf '%s\n' "$out"
    id=$(printf '%s\n' "$out" | sed -n 's/^ *task *\([0-9A-F]*\)$/\1/p')
    show "... and a later request pages $1's hits, largest first" \
        search-results --user "$1" --task "$id" --sort size --desc
}
search_as alice "alice searches three shares on two volumes (walked: no volume index yet)"
search_as carol "carol may list public only: photo is skipped, and alice's private folder in public too"
show "root builds /volume1's index (/volume2 is read-only: it stays walked)" \
    index build /volume1
search_as alice "The same search again: /volume1 through its index, with the same hits"
search_as carol "carol again: the index's rows are held to what she may list"
# An upload's last steps: the file has arrived in a folder of alice's beside the shares.
mkdir -p /volume1/@tmp/upload && chown "$(id -u alice)" /volume1/@tmp/upload
printf 'sand and sea\n' > /volume1/@tmp/upload/part && chown "$(id -u alice)" /volume1/@tmp/upload/part
echo 'filebrowserxferlog="yes"' >> /etc/quibinfo.conf
show "An upload lands in photo as alice's file, and the transfer log gets one record" \
    upload --user alice /volume1/@tmp/upload/part /photo/2024/notes.txt
show "bob may only read photo: his upload is refused before anything moves" \
    upload --user bob /volume2/archive/2019/report.pdf /photo/2024/report.pdf
export HTTP_HOST=nas:5000  # as the web server passes a request's Host header
show "A download recorded by hand, with the address a client reaches the device under" \
    xferlog --user bob --size 4096 download /archive/2019/report.pdf
printf '\n== A visitor opens the sharing link "photos": the link database gives its folder, the CGI\n'
printf '   program answers with the landing page (the first lines; the web server would add its own)\n'
printf '$ QUERY_STRING='"'"'api=page&FOLDER_SHARING=photos'"'"' norvo.cgi | head -9\n'
QUERY_STRING='api=page&FOLDER_SHARING=photos' REQUEST_METHOD=GET "$NORVO_CGI" | head -9
printf '\n== The link "old" expired in 2023: no folder, no page\n'
printf '$ QUERY_STRING='"'"'api=page&FOLDER_SHARING=old'"'"' norvo.cgi\n'
QUERY_STRING='api=page&FOLDER_SHARING=old' REQUEST_METHOD=GET "$NORVO_CGI"
printf '\nEnd of the tour.\n'
