#pragma once
// A reader reaching up into a processor: the layer check must refuse this tree.
#include "base/errors.hpp"
#include "stripmap/procparm.hpp"
