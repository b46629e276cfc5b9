// Replaces a state file by each text in turn, and says so: StateFileReplacer FILE TEXT...

#include "keystrand-linux/StateFile.h"

#include <iostream>

int main(int count, char** words) {
    using keystrand::usb::StateFile;
    const StateFile file(words[1], StateFile::Durability::synced);
    for (int i = 2; i < count; ++i) {
        std::string problem;
        if (!file.replace(words[i], problem)) {
            std::cerr << problem << '\n';
            return 1;
        }
        std::cout << "replaced by " << words[i] << std::endl;
    }
    return 0;
}
