# Japanese emotion words, written for this project (mkbdb's lexicon format: the emotion
# label is the base form of a record of class "unkonwn"). A word is a base form of
# IPADIC: its conjugated forms get the same label ("嬉しい" gives "嬉しく", "嬉しかっ",
# ...); a word written "=word" is that exact form only, and wins over the others.
#
# Negation auxiliaries (ない, ぬ and its form ず, ん, まい).
ない	unkonwn=negation
ぬ	unkonwn=negation
ん	unkonwn=negation
まい	unkonwn=negation
# Intensifiers.
=とても	unkonwn=strong adverb
=すごく	unkonwn=strong adverb
=凄く	unkonwn=strong adverb
=非常	unkonwn=strong adverb
=大変	unkonwn=strong adverb
=たいへん	unkonwn=strong adverb
=かなり	unkonwn=strong adverb
=本当	unkonwn=strong adverb
=ほんとう	unkonwn=strong adverb
=めっちゃ	unkonwn=strong adverb
=超	unkonwn=strong adverb
=実に	unkonwn=strong adverb
=極めて	unkonwn=strong adverb
=随分	unkonwn=strong adverb
=ずいぶん	unkonwn=strong adverb
=最も	unkonwn=strong adverb
=もっとも	unkonwn=strong adverb
# Clearly positive and negative words.
最高	unkonwn=very positive
素晴らしい	unkonwn=very positive
すばらしい	unkonwn=very positive
大好き	unkonwn=very positive
完璧	unkonwn=very positive
すごい	unkonwn=very positive
感動	unkonwn=very positive
好き	unkonwn=positive
嬉しい	unkonwn=positive
うれしい	unkonwn=positive
楽しい	unkonwn=positive
たのしい	unkonwn=positive
良い	unkonwn=positive
よい	unkonwn=positive
いい	unkonwn=positive
美しい	unkonwn=positive
綺麗	unkonwn=positive
きれい	unkonwn=positive
可愛い	unkonwn=positive
かわいい	unkonwn=positive
面白い	unkonwn=positive
おもしろい	unkonwn=positive
優しい	unkonwn=positive
素敵	unkonwn=positive
幸せ	unkonwn=positive
安心	unkonwn=positive
満足	unkonwn=positive
元気	unkonwn=positive
上手	unkonwn=positive
ありがとう	unkonwn=positive
喜ぶ	unkonwn=positive
笑う	unkonwn=positive
成功	unkonwn=positive
嫌い	unkonwn=negative
悲しい	unkonwn=negative
かなしい	unkonwn=negative
寂しい	unkonwn=negative
さびしい	unkonwn=negative
怖い	unkonwn=negative
こわい	unkonwn=negative
痛い	unkonwn=negative
辛い	unkonwn=negative
つらい	unkonwn=negative
残念	unkonwn=negative
心配	unkonwn=negative
不安	unkonwn=negative
悪い	unkonwn=negative
わるい	unkonwn=negative
下手	unkonwn=negative
困る	unkonwn=negative
怒る	unkonwn=negative
泣く	unkonwn=negative
失敗	unkonwn=negative
退屈	unkonwn=negative
疲れる	unkonwn=negative
最悪	unkonwn=very negative
大嫌い	unkonwn=very negative
ひどい	unkonwn=very negative
酷い	unkonwn=very negative
最低	unkonwn=very negative
絶望	unkonwn=very negative
恐ろしい	unkonwn=very negative
憎む	unkonwn=very negative
