# SPDX-License-Identifier: Apache-2.0
# collector.pl FILE: a node's system log. Listens on /dev/log and appends one line per message to
# FILE.
#
# Not busybox's syslogd, which truncates messages at 1,024 bytes and lets its file grow without
# limit. Here messages of up to 8,192 bytes stay whole, and at 8 MiB the file is renamed to
# FILE.old.
use strict;
use warnings;
use IO::Handle;
use POSIX qw(strftime);
use Socket;
use Time::HiRes qw(time);

my ($file) = @ARGV;
my $limit = 8 * 1024 * 1024;
my @levels = qw(emerg alert crit err warning notice info debug);

sub openLog {
    open my $handle, '>>', $file or die "collector: cannot append to $file: $!\n";
    $handle->autoflush(1);
    return $handle;
}

unlink '/dev/log';
socket my $socket, PF_UNIX, SOCK_DGRAM, 0 or die "collector: no socket: $!\n";
bind $socket, sockaddr_un('/dev/log') or die "collector: cannot listen on /dev/log: $!\n";
chmod 0666, '/dev/log';

my $log = openLog();
while (1) {
    defined recv $socket, my $message, 8192, 0 or next;
    my $level = $message =~ s/^<(\d{1,3})>// ? $levels[ $1 & 7 ] : 'notice';
    $message =~ s/^[A-Z][a-z]{2} [ \d]\d \d\d:\d\d:\d\d //;
    $message =~ s/[\0\n]+$//;
    $message =~ s/([\0-\x1f\x7f])/sprintf '\\x%02x', ord $1/ge;
    my $now = time;
    printf {$log} "%s.%03d %-7s %s\n", strftime('%Y-%m-%d %H:%M:%S', localtime $now),
        ($now - int $now) * 1000, $level, $message;
    if (-s $log > $limit) {
        rename $file, "$file.old";
        $log = openLog();
    }
}
