#include "platform/ui/transition_coordinator.h"

namespace zaf::ui {

void TransitionCoordinator::animateAlongsideTransition(const Block &alongside, const Block &completion)
{
    // The window has its new size already, so there is nothing to animate alongside: run now.
    if (alongside)
        alongside();
    if (completion)
        m_completions.push_back(completion);
}

void TransitionCoordinator::complete()
{
    // Taken out first, so a completion that queues another block cannot run it twice.
    std::vector<Block> completions;
    completions.swap(m_completions);
    for (const Block &block : completions)
        block();
}

} // namespace zaf::ui
