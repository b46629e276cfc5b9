// Exists to be compiled with the headers that every test program shares.
int main() {
    return 0;
}
