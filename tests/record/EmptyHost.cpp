// A program with one block.

#include <cstdlib>

int main() {
    std::free(std::malloc(70000));
    return 0;
}
