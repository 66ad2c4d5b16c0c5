#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# Whether a lab's network can be created in this namespace: a switch, a link, a firewall table.
set -euo pipefail
PATH=$PATH:/usr/sbin:/sbin
ip link add sw0 type bridge
ip link add a0 type veth peer name a1
ip link set a0 master sw0 up
nft add table bridge lab
