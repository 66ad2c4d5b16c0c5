# SPDX-License-Identifier: Apache-2.0
# search.pl FOLDER...: where secrets are left on this node. Reads lines "NAME SECRET" from standard
# input, so that they are in no list of processes, and prints a line "NAME PLACE" for each secret that
# is in the memory, arguments or environment of a program of this node, or in a file of a folder.
use strict;
use warnings;
use File::Find;

my %secrets = map { chomp; split / /, $_, 2 } <STDIN>;
my $longest = 1024;
my $chunk = 1 << 20;

# searchIn HANDLE END PLACE: from where the handle is to END bytes further, or its end.
sub searchIn {
    my ($handle, $left, $place, $found) = @_;
    my $before = '';
    while ($left > 0) {
        my $size = sysread $handle, my $text, $left < $chunk ? $left : $chunk;
        return unless $size; # the end, or a page that nobody may read
        $left -= $size;
        my $all = $before . $text;
        for my $name (keys %secrets) {
            $found->{"$name $place"} = 1 if index($all, $secrets{$name}) >= 0;
        }
        $before = substr $text, -$longest if $size > $longest;
        $before = $text if $size <= $longest;
    }
}

sub searchFile {
    my ($path, $place, $found) = @_;
    open my $handle, '<:raw', $path or return 0;
    searchIn($handle, 1 << 30, $place, $found);
    return 1;
}

sub ofThisNode {
    open my $handle, '<:raw', "/proc/$_[0]/environ" or return 0;
    local $/;
    my $all = "\0" . (<$handle> // '') . "\0";
    return index($all, "\0OVRADR_LAB_ID=$ENV{OVRADR_LAB_ID}\0") >= 0 &&
        index($all, "\0OVRADR_LAB_NODE=$ENV{OVRADR_LAB_NODE}\0") >= 0;
}

my %found;
my $programs = 0;
for my $path (glob '/proc/[0-9]*') {
    my ($pid) = $path =~ /(\d+)$/;
    open my $comm, '<', "$path/comm" or next;
    chomp(my $name = <$comm> // '');
    next unless $name =~ /^(ovradrd?|farlinkd)$/ && ofThisNode($pid);
    searchFile("$path/$_", "$name $_", \%found) for qw(cmdline environ);
    open my $maps, '<', "$path/maps" or die "search.pl: the memory of $name cannot be read: $!\n";
    open my $memory, '<:raw', "$path/mem" or die "search.pl: the memory of $name cannot be read: $!\n";
    my $bytes = 0;
    for (<$maps>) {
        my ($begin, $end, $what) = /^([0-9a-f]+)-([0-9a-f]+) rw\S* \S+ \S+ \S+\s*(.*)/ or next;
        no warnings 'portable';
        sysseek $memory, hex $begin, 0;
        searchIn($memory, hex($end) - hex($begin), "$name memory " . ($what || 'anonymous'), \%found);
        $bytes += hex($end) - hex($begin);
    }
    die "search.pl: $name has no memory\n" unless $bytes;
    ++$programs;
}
die "search.pl: no program runs here\n" unless $programs;
find({ no_chdir => 1, wanted => sub { searchFile($_, $_, \%found) if -f $_ && !-l $_ } }, grep { -d } @ARGV);
print "$_\n" for sort keys %found;
