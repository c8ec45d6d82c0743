// The extension process: its entry is the runtime's extension main routine.
#include "extension/extension_declaration.h"

int main(int argc, char **argv)
{
    return zaf::extensionkit::extensionMain(argc, argv, ZafVideoEditorExtensionDeclaration());
}
