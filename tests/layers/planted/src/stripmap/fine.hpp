#pragma once
// A processor including a reader is allowed.
#include "envisat/records.hpp"
