# Debian systems below build/package-root, in which packages are built and tried: shared by
# script/package and script/check-package, which source it after common.sh and have set
# `architecture`. They need root.
# shellcheck shell=bash

release=bookworm
roots=$PWD/build/package-root/${architecture:?}
case $architecture in
i386) personality=linux32 ;;
amd64) personality=linux64 ;;
*) fail "no architecture $architecture; there are: i386 amd64" ;;
esac

# What is mounted in there, is mounted for that command only. In a chroot whose root is not mounted
# itself, unshare cannot part the mounts, and they go because they are unmounted.
own=(unshare --mount)
"${own[@]}" true 2>/dev/null || own+=(--propagation unchanged)

# enter ROOT COMMAND...: runs the command inside, with /proc, which goes with the command, and nothing
# else of the system outside. The network is that of the system outside.
enter() {
    local root=$1
    shift
    cp /etc/resolv.conf "$root/etc/resolv.conf"
    # The variables are those of the inner shell.
    # shellcheck disable=SC2016
    "${own[@]}" bash -ec 'mount -t proc proc "$0/proc"
        trap "umount --lazy \"$0/proc\"" EXIT
        chroot "$0" "$@"' "$root" \
        setarch "$personality" env --ignore-environment HOME=/root LC_ALL=C.UTF-8 TERM=dumb \
        PATH=/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin \
        DEBIAN_FRONTEND=noninteractive DEB_BUILD_OPTIONS="parallel=${jobs:?} ${DEB_BUILD_OPTIONS:-}" \
        ${http_proxy:+"http_proxy=$http_proxy"} ${https_proxy:+"https_proxy=$https_proxy"} "$@"
}

# The folders with a system hold nothing of the one outside, whatever became of an earlier run.
discard() { # ROOT
    rm -rf --one-file-system "$1"
}

# The mirror of the release in the machine's own sources.
mirror() {
    # apt-get knows these by the dollar signs.
    # shellcheck disable=SC2016
    apt-get indextargets --format '$(RELEASE) $(COMPONENT) $(REPO_URI)' 'Created-By: Packages' |
        awk -v release="$release" '$1 == release && $2 == "main" { print $3; exit }'
}

# A bare system, base. It has the release alone, as that is what everybody can install: what security
# updates change is none of a package's business.
makeBase() {
    local base=$roots/base uri
    if [[ -e $base.made && -z $(find "$base.made" -mtime +6) ]]; then return; fi
    uri=$(mirror)
    [[ -n $uri ]] || fail "apt knows no mirror of Debian $release"
    rm -f "$base.made"
    discard "$base"
    mkdir -p "$base"
    step "root: $release, $architecture" "${own[@]}" debootstrap --variant=minbase \
        --arch="$architecture" "$release" "$base" "$uri"
    # What is in these roots need not survive a power cut.
    echo force-unsafe-io >"$base/etc/dpkg/dpkg.cfg.d/unsafe-io"
    {
        echo 'APT::Install-Recommends "false";'
        echo 'Acquire::Languages "none";'
        apt-config dump | grep -E '^Acquire::(Check-Valid-Until|Retries|https?::(Proxy|Timeout)) ' || true
    } >"$base/etc/apt/apt.conf.d/90koru"
    enter "$base" apt-get -qq update
    enter "$base" apt-get clean
    touch "$base.made"
}

# Makes one root of another by a command in it, unless that has been done since the base was made and
# the file was changed.
derive() { # LABEL FROM TO FILE COMMAND...
    local label=$1 to=$roots/$3 file=$4
    if [[ $to.made -nt $roots/base.made && $to.made -nt $file ]]; then return; fi
    rm -f "$to.made"
    copyRoot "$2" "$3"
    step "root: $label" enter "$to" "${@:5}"
    touch "$to.made"
}

copyRoot() { # FROM TO
    discard "$roots/$2"
    cp -a --reflink=auto "$roots/$1" "$roots/$2"
}

# The project's files as git knows them, in a folder for someone who is not root in there.
copySources() { # ROOT FOLDER
    mkdir -p "$1$2"
    git -c safe.directory="$PWD" ls-files -z --cached | _existing |
        tar --null --files-from=- -c | tar -C "$1$2" --no-same-owner -x
    enter "$1" chown -R builder: "/$(cut -d / -f 2 <<<"$2")"
}
