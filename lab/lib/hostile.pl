# SPDX-License-Identifier: Apache-2.0
# hostile.pl ADDRESS PORT: an appliance that means harm. Answers every request over plain http with a
# legal reply document of 8 MiB, nothing but numbers.
use strict;
use warnings;
use IO::Socket::INET;

my ($address, $port) = @ARGV;
my $listener = IO::Socket::INET->new(LocalAddr => $address, LocalPort => $port, Listen => 128,
    ReuseAddr => 1) or die "hostile: cannot listen on $address, port $port: $!\n";
my $body = '{"success":true,"data":{"x":[0' . ',0' x (4 * 1024 * 1024 - 20) . ']}}';
$SIG{PIPE} = 'IGNORE';
$SIG{CHLD} = 'IGNORE';
while (my $connection = $listener->accept) {
    next if fork;
    while (1) {
        my ($length, $lines) = (0, 0);
        while (defined(my $line = <$connection>)) {
            $length = $1 if $line =~ /^Content-Length: *(\d+)/i;
            $lines++;
            last if $line =~ /^\r?\n$/;
        }
        exit if !$lines;
        read $connection, my $request, $length;
        print $connection "HTTP/1.1 200 OK\r\nContent-Type: application/json\r\nContent-Length: ",
            length $body, "\r\n\r\n", $body or exit;
        $connection->flush;
    }
}
