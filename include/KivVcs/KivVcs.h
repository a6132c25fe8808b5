#pragma once

/// @file
/// Everything public. Start with `Repository.h`.

#include "KivVcs/Blob.h"
#include "KivVcs/Commit.h"
#include "KivVcs/CommitTree.h"
#include "KivVcs/Conflicts.h"
#include "KivVcs/Differences.h"
#include "KivVcs/Foundation.h"
#include "KivVcs/Helpers.h"
#include "KivVcs/History.h"
#include "KivVcs/IRepository.h"
#include "KivVcs/Id.h"
#include "KivVcs/Merge.h"
#include "KivVcs/MergeOutcome.h"
#include "KivVcs/Object.h"
#include "KivVcs/PortablePaths.h"
#include "KivVcs/Repository.h"
#include "KivVcs/SHADigest256.h"
#include "KivVcs/ShortIds.h"
#include "KivVcs/Storage.h"
#include "KivVcs/Tree.h"
