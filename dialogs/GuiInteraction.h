#pragma once

#include "common/RootDirectory.h"
#include "policy/Interaction.h"

// The engine's questions and messages as the administrator sees them: modal
// message boxes and dialogs over the window that is active at the time.
class GuiInteraction : public Interaction
{
public:
    // Paths the dialogs check on disk resolve under root.
    explicit GuiInteraction(const RootDirectory &root = RootDirectory::fromEnvironment());

    void show(const Message &message) override;
    Button ask(const Question &question) override;
    std::optional<QString> chooseOwner(const QStringList &accounts) override;
    std::optional<QString> askPath(const QString &label, const QString &initial) override;
    PamChoice askPamProblem() override;
    [[noreturn]] void exitProcess(int status) override;

private:
    RootDirectory m_root;
};
