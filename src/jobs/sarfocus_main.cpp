// sarfocus: the engine for a person at a terminal. It lays out the host's files for one
// product, runs focussing, shows its progress and sums up the outcome.
#include "jobs/standalone.hpp"

int main(int argc, char** argv) { return sar::jobs::sarfocus_main(argc, argv); }
