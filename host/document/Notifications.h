#pragma once
// The document library's notifications: what tools, panels and documents tell each other.

#include "host/document/ToolID.h"
#include "host/kernel/Countable.h"
#include "host/kernel/Notification.h"
#include "host/kernel/String.h"

#include <string>

class DocumentController;

// A notification about one document, identified by its controller.
class DocumentNotification : public Kernel::Notification {
public:
    explicit DocumentNotification(Kernel::NonCounted<DocumentController> controller)
        : m_Controller(controller) {}
    Kernel::NonCounted<DocumentController> GetDocumentController() const noexcept { return m_Controller; }

private:
    Kernel::NonCounted<DocumentController> m_Controller;
};

// A tool changed its parameters; panels refresh their reflected values.
class ToolParametersChangedNotification : public DocumentNotification {
public:
    ToolParametersChangedNotification(Kernel::NonCounted<DocumentController> controller, ToolID tool)
        : DocumentNotification(controller)
        , m_Tool(tool) {}
    ToolID GetToolID() const noexcept { return m_Tool; }
    std::string Describe() const override {
        return "ToolParametersChanged tool=" + std::to_string(int(m_Tool));
    }

private:
    ToolID m_Tool;
};

// Ends a before/after split view.
class TwoUpStopNotification : public DocumentNotification {
public:
    using DocumentNotification::DocumentNotification;
    std::string Describe() const override { return "TwoUpStop"; }
};

// The layer selection changed.
class NewSelectionNotification : public DocumentNotification {
public:
    using DocumentNotification::DocumentNotification;
    std::string Describe() const override { return "NewSelection"; }
};

// An entry was added to, merged into, undone or redone in the history.
class DocumentHistoryChangedNotification : public DocumentNotification {
public:
    using DocumentNotification::DocumentNotification;
    std::string Describe() const override { return "DocumentHistoryChanged"; }
};

// A message for the user that does not block the interface.
class ModelessMessageNotification : public Kernel::Notification {
public:
    ModelessMessageNotification(Kernel::LocalisedString title, Kernel::LocalisedString message)
        : m_Title(std::move(title))
        , m_Message(std::move(message)) {}
    const Kernel::LocalisedString& GetTitle() const noexcept { return m_Title; }
    const Kernel::LocalisedString& GetMessage() const noexcept { return m_Message; }
    std::string Describe() const override {
        return "ModelessMessage title=\"" + m_Title.Localise() + "\" message=\"" + m_Message.Localise() +
               "\"";
    }

private:
    Kernel::LocalisedString m_Title;
    Kernel::LocalisedString m_Message;
};
