# SPDX-License-Identifier: Apache-2.0
# slow.pl lives HOST HTTP HTTPS COUNT: COUNT slow connections of each kind, and a line "KIND LONGEST" for
# each: for how many seconds the longest was served.
# slow.pl holds HOST COUNT PORT...: COUNT silent connections to each port, made anew as they end, until
# this is killed.
use strict;
use warnings;
use Errno qw(EAGAIN);
use IO::Select;
use IO::Socket::INET;
use Time::HiRes qw(time sleep);

$SIG{PIPE} = 'IGNORE';
my $do = shift // '';

sub dial {
    my ($host, $port) = @_;
    my $socket = IO::Socket::INET->new(PeerAddr => $host, PeerPort => $port, Timeout => 5) or return;
    $socket->blocking(0);
    return $socket;
}

# lives: each second one more byte of what is sent, until the other end closes.
sub lives {
    my ($host, $http, $https, $count) = @_;
    my $get = "GET /webapi/query.cgi HTTP/1.1\r\nHost: a\r\n\r\n";
    my $post = "POST /webapi/query.cgi HTTP/1.1\r\nHost: a\r\n" .
        "Content-Type: application/x-www-form-urlencoded\r\nContent-Length: 1000000\r\n";
    my %kinds = ( # port, what is sent at once, and what then slowly
        handshake => [$https, '', "\x16\x03\x01\x02\x00\x01\x00\x01\xfc\x03\x03" . 'x' x 500],
        header => [$http, '', $post . 'X: ' . 'x' x 9999],
        body => [$http, "$post\r\n", 'x' x 9999],
        second => [$http, $get, $get . 'x' x 9999],
        unread => [$http, '', $get x 200000],
    );
    my (@open, %longest);
    for my $kind (sort keys %kinds) {
        my ($port, $first, $slow) = @{ $kinds{$kind} };
        for (1 .. $count) {
            my $socket = dial($host, $port) or die "slow: no connection to port $port: $!\n";
            syswrite $socket, $first if length $first;
            push @open, { socket => $socket, kind => $kind, rest => $slow, since => time };
        }
        $longest{$kind} = 0;
    }
    my $end = time + 90;
    while (@open && time < $end) {
        my @still;
        for my $each (@open) {
            my ($socket, $kind) = @$each{qw(socket kind)};
            my $unread = $kind eq 'unread';
            # One that does not read is served until the other end's buffers are full.
            my $wrote = syswrite $socket, $each->{rest}, $unread ? 65536 : 1;
            my $over = !defined $wrote && $! != EAGAIN;
            if ($wrote) {
                substr($each->{rest}, 0, $wrote) = '';
                $each->{since} = time if $unread;
            }
            while (!$unread && !$over) {
                my $got = sysread $socket, my $text, 4096;
                last if !defined $got && $! == EAGAIN;
                $over = !$got;
            }
            if ($over) {
                my $life = time - $each->{since};
                $longest{$kind} = $life if $life > $longest{$kind};
            } else {
                push @still, $each;
            }
        }
        @open = @still;
        sleep 1;
    }
    $longest{ $_->{kind} } = 999 for @open;
    printf "%s %.1f\n", $_, $longest{$_} for sort keys %longest;
}

sub holds {
    my ($host, $count, @ports) = @_;
    my %held;
    while (1) {
        for my $port (@ports) {
            $held{$port} = [grep { IO::Select->new($_)->can_read(0) ? sysread($_, my $text, 4096) : 1 } @{ $held{$port} // [] }];
            while (@{ $held{$port} } < $count) {
                my $socket = dial($host, $port) or last;
                push @{ $held{$port} }, $socket;
            }
        }
        sleep 0.02;
    }
}

$do eq 'lives' ? lives(@ARGV) : $do eq 'holds' ? holds(@ARGV) : die "slow: lives or holds\n";
