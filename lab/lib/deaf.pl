# SPDX-License-Identifier: Apache-2.0
# deaf.pl ADDRESS PORT FILE: an appliance that hangs. Accepts every connection and never sends
# anything; logs each as a line in FILE.
use strict;
use warnings;
use IO::Handle;
use IO::Socket::INET;

my ($address, $port, $file) = @ARGV;
my $listener = IO::Socket::INET->new(LocalAddr => $address, LocalPort => $port, Listen => 128,
    ReuseAddr => 1) or die "deaf: cannot listen on $address, port $port: $!\n";
open my $count, '>', $file or die "deaf: cannot write $file: $!\n";
$count->autoflush(1);
my @held;
while (my $connection = $listener->accept) {
    print $count $connection->peerport, "\n";
    push @held, $connection;
}
