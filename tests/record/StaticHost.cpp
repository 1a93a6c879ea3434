// A program without a loader.

int main() {
    return 0;
}
