# SPDX-License-Identifier: Apache-2.0
# delay.pl TAP-A TAP-B MILLISECONDS: forwards every frame from either TAP device to the other after
# half of that time. Prints "ready" once it runs, and exits when a TAP device is removed. With --probe
# it only checks whether that would work.
#
# TAP devices, because the kernel passes their frames as they would be on a cable: no longer than
# the MTU, and with checksums.
use strict;
use warnings;
use Errno;
use Fcntl;
use Time::HiRes qw(clock_gettime CLOCK_MONOTONIC);

# Numbers: linux/if_tun.h.
my ($setInterface, $tap, $noHeader) = (0x400454ca, 0x0002, 0x1000);

my ($nameA, $nameB, $milliseconds) = @ARGV;
if ($nameA eq '--probe') {
    openTap('probe');
    exit;
}
my $delay = $milliseconds / 2000;
# Beyond this a kernel queue would drop frames as well.
my $most = 20_000;

sub openTap {
    my ($name) = @_;
    sysopen my $handle, '/dev/net/tun', O_RDWR | O_NONBLOCK or die "/dev/net/tun: $!\n";
    my $request = pack 'a16 s x22', $name, $tap | $noHeader;
    ioctl $handle, $setInterface, $request or die "$name: $!\n";
    return $handle;
}

my @ends   = (openTap($nameA), openTap($nameB));
my @queues = ([], []);    # frames for that end, each with its due time
$| = 1;
print "ready\n";

while (1) {
    my $wanted = '';
    vec($wanted, fileno $_, 1) = 1 for @ends;
    my $now  = clock_gettime(CLOCK_MONOTONIC);
    my $wait = 1;
    for (grep { @$_ } @queues) {
        my $left = $_->[0][0] - $now;
        $wait = $left if $left < $wait;
    }
    select $wanted, undef, undef, $wait > 0 ? $wait : 0;
    for my $from (0, 1) {
        my $queue = $queues[ 1 - $from ];
        my $due   = clock_gettime(CLOCK_MONOTONIC) + $delay;
        my ($size, $frame);
        while ($size = sysread $ends[$from], $frame, 65536) {
            push @$queue, [ $due, $frame ] if @$queue < $most;
        }
        exit unless defined $size || $!{EAGAIN} || $!{EINTR} || $!{EIO};    # EIO: not up yet
    }
    for my $to (0, 1) {
        my $queue = $queues[$to];
        $now = clock_gettime(CLOCK_MONOTONIC);
        while (@$queue && $queue->[0][0] <= $now) {
            syswrite $ends[$to], (shift @$queue)->[1];
        }
    }
}
