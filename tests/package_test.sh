#!/bin/bash
# Makes the Debian packages, and installs, uses, upgrades, removes and purges them in the sandbox with all
# of /usr and /var private as well. Needs root or sudo.
#
#   tests/package_test.sh BUILD_FOLDER     built, and configured with -DCMAKE_INSTALL_PREFIX=/usr
#
# Exit status 77 where the caller is no root and has no sudo.
set -euo pipefail
source=$(cd "$(dirname "$0")/.." && pwd)
debs=$(cd "$1" && pwd)/packages
later=99.0.0
crontab=/etc/crontab
check=/usr/tavi/bin/tavi_poweroff_feasible_check
tasks=/usr/tavi/etc/scheduled_tasks
working=/tmp/scheduled_tasks
unit=/usr/lib/systemd/system/tavischeduler.service
own=/home/package_test # what the test itself keeps, in the sandbox
log=$own/log

step() { printf 'package_test: %s\n' "$*"; }
fail() { printf 'package_test: FAILED: %s\n' "$*" >&2; exit 1; }
expect() { local what=$1; shift; "$@" || fail "$what"; }
quietly() { "$@" >"$log" 2>&1 </dev/null || { cat "$log" >&2; fail "$*"; }; }
manage() { quietly dpkg --force-confdef --force-confold --ignore-depends=cockpit-bridge "$@"; }
files() { find /etc /usr /tmp /run /var/lib/dpkg/info ! -path '/etc/ld.so.cache*' | sort -T $own; }
expect_same() { expect "$1 changed $2" cmp "$2" "$own/${2##*/}"; }
expect_own_crontab() { # as it was before the installation
    expect "after $1 $crontab is not the machine's own" cmp $crontab $own/crontab.own
    expect "$1 changed mode or owner of $crontab" [ "$(stat -c %a:%U:%G $crontab)" = 640:root:adm ]
}
expect_only_cron_missing() {
    local found; found=$(tavisched check | sed -n 's/^problem: //p') || true
    expect "check complains: $found" [ "${found%%,*}, $(wc -l <<< "$found")" = "cron is not running, 1" ]
}
expect_working_copy() { # as the stored tasks are, of root's alone
    expect "$1 left $working $(stat -c %a:%U:%h $working)" [ "$(stat -c %a:%U:%h $working)" = 600:root:1 ]
    expect "$1 left other tasks in $working" cmp $working "$2"
}
boot() { # what tmpfiles.d and the unit do; of /tmp nothing is left, or what is there stays
    [ "$1" = stays ] || rm -rf $working* /tmp/lock /tmp/tavischedtask /tmp/sched_status.sqlite*
    quietly systemd-tmpfiles --boot --remove --create tavischeduler.conf
    expect "the name of the working copy is free before the unit runs" [ -f $working ]
    # shellcheck disable=SC2046 # a list of words
    quietly $(sed -n 's/^ExecStart=//p' $unit)
}
expect_files() {
    local wrong package=$1; shift
    for file in "$@"; do
        expect "$package lacks $file" grep -qx "$file" <(dpkg -L "$package")
        expect "$file is not there" [ -e "$file" ]
    done
    wrong=$(dpkg-deb -c "$debs/now/${package}"_* | grep -Ev '^(l.{9}|[-d]rwxr-xr-x|-rw-r--r--) root/root ') || true
    expect "$package has files of a wrong owner or mode: $wrong" [ -z "$wrong" ]
}

if [ $# -eq 1 ]; then
    expect "$1 is not configured with the prefix /usr" [ -f "$1/CPackConfig.cmake" ]
    sudo=; [ "$(id -u)" -eq 0 ] || sudo="sudo -n"
    $sudo true || { step "skipped: needs root or sudo"; exit 77; }
    log=$debs/log
    rm -rf "$debs"
    mkdir "$debs"
    cd "$1"
    step "making the packages of this version, and of version $later from them"
    umask 027 # must not show in the packages
    quietly cpack -G DEB -B packages/now
    umask 022
    mkdir "$debs/later"
    for deb in "$debs"/now/*.deb; do
        quietly dpkg-deb -R "$deb" "$debs/content"
        version=$(sed -n 's/^Version: //p' "$debs/content/DEBIAN/control")
        sed -i "s/\(Version: \|tavischeduler (= \)$version/\1$later/" "$debs/content/DEBIAN/control"
        quietly dpkg-deb --root-owner-group -b "$debs/content" "$debs/later"
        rm -r "$debs/content"
    done
    exec $sudo "$source/scripts/sandbox" "$source/tests/package_test.sh" "$PWD" inside
fi

# What lies in /usr/local on the machine is not tested, and nothing of the environment counts.
export PATH=/usr/sbin:/usr/bin:/sbin:/bin LC_ALL=C.UTF-8 DEBIAN_FRONTEND=noninteractive
unset LD_LIBRARY_PATH LIBRARY_PATH CPATH PKG_CONFIG_PATH CMAKE_PREFIX_PATH
rm -rf /usr/tavi
mkdir $own
for folder in /usr/*/ /var/; do
    mkdir -p "$own$folder"{upper,work}
    mount -t overlay overlay -o "lowerdir=$folder,upperdir=$own${folder}upper,workdir=$own${folder}work" "$folder"
done
mount -t tmpfs local /usr/local
manage --purge tavischeduler{-cockpit,-dev,} # where the machine has them
rm -f /var/lib/man-db/auto-update              # saves time
mkdir -p /usr/tavi/bin
touch /usr/tavi/bin/of-the-machine
printf '%s\n' 'SHELL=/bin/sh' '# tavischedtask' '0 5 * * * root /opt/tavischedtask' > $crontab
chown root:adm $crontab
chmod 640 $crontab
cp $crontab $own/crontab.own
files > $own/files

step "installation"
manage -i "$debs"/now/*.deb
for package in 'cron | cron-daemon' procps libc6 libjsoncpp libsodium libsqlite3-0 libstdc++6 libunistring; do
    expect "no dependency on $package" grep -qF "$package" <(dpkg -s tavischeduler | grep ^Depends:)
done
lib=/usr/lib/$(cc -print-multiarch)
expect_files tavischeduler /usr/sbin/tavisched{,task} "$lib"/lib{tavischeduler.so.4,taviplatform.so.1} \
    /usr/lib/tmpfiles.d/tavischeduler.conf $unit /usr/share/man/man8/tavisched{,task}.8.gz \
    /usr/share/{bash-completion/completions/tavisched,zsh/vendor-completions/_tavisched} \
    /usr/share/fish/vendor_completions.d/tavisched.fish /usr/tavi/etc/plugins/task_scheduler{,_run} \
    $check /usr/share/tavischeduler/{${check##*/},run-handlers/{mail-failures,post-to-url,prometheus-metrics}} /usr/share/doc/tavischeduler/{copyright,{changelog.Debian,README.md}.gz}
expect_files tavischeduler-dev /usr/include/{tavischeduler,tavischedgetter,tavischedsetter}.h \
    /usr/include/{platc,platplugin,tavisdk}.h "$lib"/lib{tavischeduler,taviplatform}.so \
    "$lib"/{pkgconfig/tavischeduler.pc,cmake/tavischeduler/tavischeduler-config.cmake} \
    /usr/share/man/man3/tavischeduler.3.gz /usr/share/doc/tavischeduler-dev/{copyright,examples/task.c}
expect_files tavischeduler-cockpit /usr/share/cockpit/tavischeduler/{manifest.json,index.html,app.js,page.css} \
    /usr/share/doc/tavischeduler-cockpit/{copyright,changelog.Debian.gz}
same="tavischeduler (= $(dpkg-query -Wf '${Version}' tavischeduler))"
expect "the versions can differ, or the page depends on other packages" \
    [ "$(dpkg-query -Wf '${Depends}|' tavischeduler-{cockpit,dev})" = "$same, cockpit-bridge|$same|" ]
expect "programs look for libraries elsewhere" \
    [ -z "$(readelf -d /usr/sbin/tavisched{,task} "$lib"/libtavi*.so | grep -E 'R(UN)?PATH')" ]
expect_only_cron_missing
expect_working_copy installation /dev/null
expect "the unit is not enabled" [ -L /etc/systemd/system/multi-user.target.wants/${unit##*/} ]
quietly systemd-analyze verify --man=no $unit
rm -rf /run/systemd # where it notes what it looked at

step "programs built over the installed package"
flags=$(pkg-config --cflags --libs tavischeduler | xargs)
expect "pkg-config says: $flags" [ "$flags" = "-ltavischeduler -ltaviplatform" ]
examples=/usr/share/doc/tavischeduler-dev/examples
# shellcheck disable=SC2086 # a list of words
quietly cc $examples/task.c -o $own/task $flags
quietly cmake -S $examples -B $own/example
quietly cmake --build $own/example

step "tasks"
id=$(tavisched add -q --name Nightly --command 'id -un > /tmp/ran' --daily --at 03:00 --owner nobody)
tavisched export --web "$id" | sed '1d; $d; s/Nightly/Weekly/' > $own/task.json
quietly $own/task save $own/task.json
expect "a program built over the package does not save a task" grep -q Weekly <(tavisched list)
quietly tavisched remove --yes 2
quietly tavisched add --power off --weekly Mon --at 04:00
expect "the task is not listed" grep -q Nightly <(tavisched list)
expect "a program built over the package does not find the task" grep -q Nightly <($own/task show "$id")
quietly tavisched run "$id" --wait
expect "the task did not run as its owner" grep -qx nobody /tmp/ran
rm /tmp/ran
expect "$crontab lacks the task's line" grep -q "/tmp/tavischedtask --run id=$id$" $crontab
expect "$crontab lacks the power-off line" grep -q "$check" $crontab

step "power-off check at boot"
rm $check
quietly systemd-tmpfiles --create tavischeduler.conf
expect "the power-off check is not made" cmp $check /usr/share/tavischeduler/${check##*/}
echo '# changed on this machine' >> $check
chmod 700 $check
cp $check $tasks $crontab $own
quietly systemd-tmpfiles --create tavischeduler.conf
expect_same boot $check
expect "boot changed the mode of $check" [ "$(stat -c %a $check)" = 700 ]

step "boot without a working copy, and without tasks"
boot is-lost
for file in $tasks $crontab; do expect_same boot "$file"; done
expect_working_copy boot $tasks
rm $tasks # lines of tasks that are nowhere else are the last trace of them
boot is-lost
expect_same "a boot without tasks" $crontab
expect_working_copy "a boot without tasks" /dev/null
cp $own/${tasks##*/} $tasks
install -o nobody $check $working # and a user's file at the name is not believed
boot stays
expect_working_copy boot $tasks

step "upgrade"
manage -i "$debs"/later/*.deb
expect "a package was not upgraded" [ "$(dpkg -s tavischeduler{,-dev,-cockpit} | grep -c "^Version: $later")" -eq 3 ]
for file in $check $tasks $crontab; do expect_same upgrade "$file"; done

step "removal"
manage --remove tavischeduler{-cockpit,-dev,}
expect_own_crontab removal
expect_same removal $tasks
expect "removal left the runner's link" [ ! -L /tmp/tavischedtask ]

step "re-installation"
manage -i "$debs"/later/*.deb
expect "re-installation does not bring lines back" cmp <(sort $crontab) <(sort $own/crontab)
expect_same re-installation $check
expect_only_cron_missing

step "purge"
manage --purge tavischeduler{-cockpit,-dev,}
expect_own_crontab purge
expect "purge left or took files" diff $own/files <(files)
expect "purge left records" [ ! -e /var/lib/tavischeduler ]
step "passed"
