#include "Measuring.h"
namespace KivVcs::Bench {
void AddHistoryWorkloads(std::vector<Workload>&, bool) {}
} // namespace KivVcs::Bench
