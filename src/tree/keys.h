// The key layout of the configuration tree, which the tool shares with the platform's programs.
#ifndef REMVOL_TREE_KEYS_H
#define REMVOL_TREE_KEYS_H

#include "tree_layout.h"

#endif
