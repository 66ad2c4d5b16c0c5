# SPDX-License-Identifier: Apache-2.0
# old-syscalls.pl COMMAND...: runs COMMAND as on a kernel without the system calls that proot does
# not know. Proot would pass them through untranslated, so that a program would see this machine's
# files instead of its node's; without them the C library falls back on those that proot translates.
#
# clone3 is not among them, although proot does not know it either. Proot only reads the flags of a
# new task there, and is better off without: after a clone with CLONE_VM, as in the C library's
# posix_spawn, proot lets parent and child share one heap record beyond the exec, and one of them
# crashes.
#
# Perl, because it is on every Debian system and can call prctl(2) by number. Numbers: asm/unistd.h;
# filter: seccomp(2), linux/filter.h, linux/audit.h.
use strict;
use warnings;
use POSIX ();

my %machines = (
    x86_64 => {
        audit => 0xc000003e,
        prctl => 157,
        calls => [ 316, 322, 332, 437, 439, 452 ],
    },
    aarch64 => {
        audit => 0xc00000b7,
        prctl => 167,
        calls => [ 276, 281, 291, 437, 439, 452 ],
    },
);    # renameat2, execveat, statx, openat2, faccessat2, fchmodat2

my $name    = (POSIX::uname())[4];
my $machine = $machines{$name}
    or die "old-syscalls: no table for the machine $name; the proot way runs on "
    . join(' and ', sort keys %machines) . "\n";

my ($load, $ifEqual, $return) = (0x20, 0x15, 0x06);
my ($allow, $noSuchCall) = (0x7fff0000, 0x00050000 | POSIX::ENOSYS());
my @calls = @{ $machine->{calls} };
my @filter = (
    [ $load,    0,           0, 4 ],
    [ $ifEqual, 0,           @calls + 1, $machine->{audit} ],
    [ $load,    0,           0, 0 ],
    (map { [ $ifEqual, @calls - $_, 0, $calls[$_] ] } 0 .. $#calls),
    [ $return, 0, 0, $allow ],
    [ $return, 0, 0, $noSuchCall ],
);
my $code    = join '', map { pack 'SCCL', @$_ } @filter;
my $program = pack 'S x![P] P', scalar(@filter), $code;

my ($setNoNewPrivileges, $setSeccomp, $modeFilter) = (38, 22, 2);
syscall($machine->{prctl}, $setNoNewPrivileges, 1, 0, 0, 0) == 0
    or die "old-syscalls: cannot give up new privileges: $!\n";
syscall($machine->{prctl}, $setSeccomp, $modeFilter, $program, 0, 0) == 0
    or die "old-syscalls: cannot set the filter: $!\n";

# A shell starts background commands with these ignored.
$SIG{INT} = $SIG{QUIT} = 'DEFAULT';
exec { $ARGV[0] } @ARGV or die "old-syscalls: cannot run $ARGV[0]: $!\n";
