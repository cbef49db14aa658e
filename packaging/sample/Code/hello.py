print("hello, search")
