#include "Measuring.h"
namespace KivVcs::Bench {
void AddReadingWorkloads(std::vector<Workload>&, bool) {}
} // namespace KivVcs::Bench
